#include "tools/RequestRunner.h"

#include <string_view>
#include <thread>
#include <utility>

#include "client/Vocabulary.h"
#include "tools/Complaint.h"
#include "tools/JsonText.h"
#include "tools/ServiceConfiguration.h"

namespace halvox::tools {
namespace {

using platform::Array;
using platform::Value;

constexpr ServiceType kUnknownService = 65535;

std::string_view nameOf(client::Failure::Kind kind) {
  switch (kind) {
    case client::Failure::Kind::kNoService:
      return "no-service";
    case client::Failure::Kind::kRefused:
      return "refused";
    case client::Failure::Kind::kTimedOut:
      return "timed-out";
    case client::Failure::Kind::kBadRequest:
      return "bad-request";
  }
  return "unknown";
}

ExitStatus statusOf(client::Failure::Kind kind) {
  switch (kind) {
    case client::Failure::Kind::kNoService:
    case client::Failure::Kind::kTimedOut:
      return ExitStatus::kNoService;
    case client::Failure::Kind::kRefused:
      return ExitStatus::kRefused;
    case client::Failure::Kind::kBadRequest:
      return ExitStatus::kBadArguments;
  }
  return ExitStatus::kRefused;
}

}  // namespace

// Carries out one request: has a function for each kind, which prints in the chosen form.
class RequestRunner::Execution {
 public:
  Execution(RequestRunner& runner, bool json, const std::string& prefix)
      : connection_(runner.connection_),
        timeout_(runner.options_.timeout),
        out_(runner.out_),
        errors_(runner.errors_),
        json_(json),
        prefix_(prefix) {}

  ExitStatus operator()(const Create& request) {
    return report("create", request.id, connection_->createReportingSession(request.id));
  }
  ExitStatus operator()(const SetType& request) {
    return report("set-type", request.id, connection_->setServiceType(request.type, request.id));
  }
  ExitStatus operator()(const Configure& request) {
    return report("configure", request.id,
                  connection_->setConfiguration(request.configuration, request.id));
  }
  ExitStatus operator()(const Start& request) {
    const auto started = connection_->startReportingSessionForID(request.id);
    // The call returns after the service has started the session. The service sends its reply to
    // the start when the session stops.
    if (!started || !request.wait) return report("start", request.id, started);
    return reportWait("start", request.id, *request.wait);
  }
  ExitStatus operator()(const WaitForStart& request) {
    const auto zero = std::chrono::milliseconds::zero();
    return reportWait("wait", request.id, request.timeout > zero ? request.timeout : timeout_);
  }
  ExitStatus operator()(const Send& request) {
    return report(
        "send", std::nullopt,
        connection_->sendMessage(request.message, request.category, request.type, request.ids));
  }
  ExitStatus operator()(const Stop& request) {
    return report("stop", request.id, connection_->stopReportingSessionForID(request.id));
  }
  ExitStatus operator()(const Destroy& request) {
    return report("destroy", request.id, connection_->destroyReportingSession(request.id));
  }
  ExitStatus operator()(const Kill&) {
    return report("kill", std::nullopt, connection_->killService());
  }

  ExitStatus operator()(const GetType& request) {
    const auto type = connection_->getServiceNameForReporterID(request.id);
    if (!type) return complain("type", *type.failure);
    const std::string name(client::serviceTypeName(*type.value));
    return print(name, {{"command", "type"},
                        {"id", request.id},
                        {"serviceType", *type.value},
                        {"serviceName", name}});
  }

  ExitStatus operator()(const Valid& request) {
    const auto answer = connection_->reporterIDValid(request.id);
    if (!answer) return complain("valid", *answer.failure);
    const Value* id = answer.value->find("reporterID");
    const Value* type = answer.value->find("serviceType");
    // The service answers with the ID 0 if the session does not exist.
    const bool isThere = id != nullptr && id->toInt64() == request.id && request.id != 0;
    const auto serviceType =
        type != nullptr ? static_cast<ServiceType>(type->toUInt64()) : kUnknownService;
    const std::string text =
        "session " + std::to_string(request.id) +
        (isThere ? ": " + std::string(client::serviceTypeName(serviceType)) : " does not exist");
    print(
        text,
        {{"command", "valid"}, {"id", request.id}, {"result", isThere}, {"answer", *answer.value}});
    return isThere ? ExitStatus::kDone : ExitStatus::kRefused;
  }

  ExitStatus operator()(const List&) {
    const auto ids = connection_->getAllReporters();
    if (!ids) return complain("list", *ids.failure);
    if (json_) {
      const std::vector<Value> values(ids.value->begin(), ids.value->end());
      return print("", {{"command", "list"}, {"reporters", Array(values)}});
    }
    for (const ReporterID id : *ids.value) out_ << id << '\n';
    return ExitStatus::kDone;
  }

  ExitStatus operator()(const Sleep& request) {
    std::this_thread::sleep_for(request.time);
    return ExitStatus::kDone;
  }

  ExitStatus complain(const char* command, const client::Failure& failure) {
    errors_ << prefix_ << command << ": " << harmlessText(failure.message);
    if (!failure.name.empty()) errors_ << " (" << harmlessText(failure.name) << ")";
    errors_ << '\n';
    if (json_) {
      out_ << failureJson(command, {nameOf(failure.kind), failure.name, failure.message}) << '\n';
    }
    return statusOf(failure.kind);
  }

 private:
  void printJson(const Dictionary& fields) { out_ << harmlessJson(toJson(fields)) << '\n'; }

  ExitStatus print(const std::string& text, const Dictionary& fields) {
    if (json_) {
      printJson(fields);
    } else {
      out_ << text << '\n';
    }
    return ExitStatus::kDone;
  }

  // Reports the answer to a request that is answered with yes or no. Prints nothing after yes.
  ExitStatus report(const char* command, std::optional<ReporterID> id,
                    const client::Result<bool>& result) {
    if (!result) return complain(command, *result.failure);
    if (!*result.value) {
      return complain(command, {client::Failure::Kind::kRefused, "", "the service answered no"});
    }
    Dictionary fields{{"command", command}};
    if (id) fields.set("id", *id);
    fields.set("result", true);
    if (json_) printJson(fields);
    return ExitStatus::kDone;
  }

  // A start without an answer does not mean a broken connection: the session is still running.
  ExitStatus reportWait(const char* command, ReporterID id, std::chrono::milliseconds time) {
    const auto answer = connection_->waitForStartReply(id, time);
    if (answer || answer.failure->kind != client::Failure::Kind::kTimedOut) {
      return report(command, id, answer);
    }
    complain(command, {client::Failure::Kind::kTimedOut, "",
                       "the start was not answered in time; the service answers it at the stop"});
    return ExitStatus::kRefused;
  }

  std::unique_ptr<client::HalvoxConnection>& connection_;  // of the runner
  std::chrono::milliseconds timeout_;
  std::ostream& out_;
  std::ostream& errors_;
  bool json_;
  const std::string& prefix_;
};

ExitStatus RequestRunner::run(const Request& request, bool json, const std::string& prefix) {
  const char* command = std::visit([](const auto& asked) { return asked.kCommand; }, request);
  // Only the first request connects. A script without requests therefore needs no service.
  if (!connection_) {
    const Complaint complain(command, json ? OutputForm::kJson : OutputForm::kText, out_, errors_);
    const auto socket = namedSocket(options_, complain);
    if (const auto* status = std::get_if<ExitStatus>(&socket)) return *status;
    auto opened = client::HalvoxConnection::open(std::get<std::string>(socket), options_.timeout);
    if (!opened) return Execution(*this, json, prefix).complain(command, *opened.failure);
    connection_ = std::move(*opened.value);
    warnOfUnservedSockets();
  }
  return std::visit(Execution(*this, json, prefix), request);
}

// Warns of sockets at earlier places on which no service listens, because the user may expect a
// service there.
void RequestRunner::warnOfUnservedSockets() {
  for (const std::string& path : connection_->unservedSockets()) {
    errors_ << "halvoxctl: no service listens on " << harmlessText(path) << "; using "
            << harmlessText(connection_->socketPath()) << '\n';
  }
}

}  // namespace halvox::tools
