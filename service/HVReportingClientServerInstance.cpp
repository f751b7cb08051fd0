#include "service/HVReportingClientServerInstance.h"

#include <exception>
#include <utility>

#include "backends/HVReportingUtility.h"
#include "backends/HVReportingUtilityVEKStateManager.h"
#include "backends/PrivacyFilter.h"
#include "platform/services.h"
#include "service/ReportingQueue.h"
#include "service/ServiceLog.h"

namespace halvox {
namespace {

constexpr int kKilledExitStatus = 2;
// Bounds the spare lists of messages, and the messages that each has room for. A list holds the
// messages of one read. Several lists are in use while a stop takes long and requests wait.
constexpr std::size_t kMostSpares = 4;
constexpr std::size_t kMostSpareMessages = 128;

// The name of the process that sent a message; none if the process has ended. The name is looked up
// for each message, because a process may rename itself at any time. A look-up reads a file, which
// costs about as much as the rest of a message. It is made only for messages whose sender is used.
std::optional<std::string> senderProcessName(AudioEventType type, platform::ProcessID sender) {
  if (!HVReportingUtilityVEKStateManager::concerns(type)) return std::nullopt;
  if (!HVReportingUtilityIsInternalBuild()) return std::nullopt;
  return HVReportingUtilityProcessNameForPID(sender);
}

// A request that came with a reply and a token of its own.
class CallbackSource final : public platform::RequestSource {
 public:
  CallbackSource(ErrorReply reply, platform::RequestToken token)
      : reply_(std::move(reply)), token_(std::move(token)) {}

  void answer(const platform::RequestMark& /*mark*/, const std::optional<platform::Error>& error,
              const platform::Value& /*value*/) override {
    reply_(error);
  }
  void carriedOut(const platform::RequestMark& /*mark*/) override { token_.reset(); }

 private:
  const ErrorReply reply_;
  platform::RequestToken token_;
};

}  // namespace

HVReportingClientServerInstance::HVReportingClientServerInstance(
    platform::ProcessID pid, std::weak_ptr<HVReportingServiceDelegateProtocol> delegate,
    Counters counters)
    : processIdentifier_(pid), delegate_(std::move(delegate)), counters_(std::move(counters)) {
  kServiceLog.notice("new client with pid ", pid);
}

HVReportingClientServerInstance::~HVReportingClientServerInstance() {
  kServiceLog.notice("dealloc ", processIdentifier_, " from the server client list");
}

std::optional<platform::Date> HVReportingClientServerInstance::clientStartDate() const {
  return clientStartDate_.copy();
}

void HVReportingClientServerInstance::setClientStartDate(platform::Date date) {
  clientStartDate_.set(date);
}

std::optional<std::string> HVReportingClientServerInstance::clientProcessName() const {
  return clientProcessName_.copy();
}

void HVReportingClientServerInstance::setClientProcessName(std::optional<std::string> name) {
  clientProcessName_.set(std::move(name));
}

HVReportingClientServerInstance::Session HVReportingClientServerInstance::findReportingSessionForID(
    ReporterID reporterID, Lookup lookup) const {
  // ID 0 is not excluded here, because a client may have created a session under it. Requests that
  // exclude ID 0 test for it themselves.
  if (const auto own = sessions_.find(reporterID); own != sessions_.end()) return own->second;
  if (lookup == Lookup::kOwnSessions) return nullptr;
  const Delegate delegate = delegate_.lock();
  return delegate == nullptr ? nullptr : delegate->findReportingSessionForID(reporterID);
}

template <typename Work>
struct HVReportingClientServerInstance::RequestJob {
  std::shared_ptr<HVReportingClientServerInstance> client;
  platform::RequestToken token;
  Work work;

  void operator()() {
    HVReportingClientServerInstance& target = *client;
    if (target.isStopping()) return target.postpone(std::move(*this));
    work(target);
    target.noteCarriedOut(std::move(token));
  }
};

// The job holds the client, so that the requests of a connection that has ended are still carried
// out. It also holds the request's token, by which the connection knows how many of its requests
// are open. A request with a dictionary charges the dictionary to its client before it is queued.
// The check of the client's next request then includes what this request will make the service
// hold.
template <typename Work>
void HVReportingClientServerInstance::queueRequest(platform::JobWeight weight,
                                                   RequestContext&& context, Work work) {
  // Messages that arrived before this request are queued first, because requests are carried out in
  // the order of their arrival.
  endOfRequests();
  counters_->requests.received.add();
  reportingQueue()->async(
      weight, RequestJob<Work>{shared_from_this(), std::move(context.token), std::move(work)});
}

// The I/O thread may run the brief requests itself. Starts, stops and destroys are not brief: they
// can wait for the drivers, a trace or a file, and on the I/O thread they would delay every
// connection meanwhile.
template <typename Member, typename Reply>
void HVReportingClientServerInstance::queueRequest(platform::JobWeight weight,
                                                   RequestContext&& context, Member carryOut,
                                                   ReporterID reporterID, Reply&& reply) {
  queueRequest(weight, std::move(context),
               [carryOut, reporterID, reply = std::forward<Reply>(reply)](auto& client) {
                 (client.*carryOut)(reporterID, reply);
               });
}

void HVReportingClientServerInstance::createReportingSession(ReporterID reporterID, BoolReply reply,
                                                             RequestContext context) {
  queueRequest(platform::JobWeight::kBrief, std::move(context),
               &HVReportingClientServerInstance::carryOutCreate, reporterID, std::move(reply));
}

void HVReportingClientServerInstance::setServiceType(AudioServiceType serviceType,
                                                     ReporterID reportingSession, BoolReply reply,
                                                     RequestContext context) {
  queueRequest(platform::JobWeight::kBrief, std::move(context),
               [serviceType, reportingSession, reply = std::move(reply)](auto& client) {
                 client.carryOutSetServiceType(serviceType, reportingSession, reply);
               });
}

void HVReportingClientServerInstance::getServiceNameForReporterID(ReporterID reporterID,
                                                                  ServiceTypeReply reply,
                                                                  RequestContext context) {
  queueRequest(platform::JobWeight::kBrief, std::move(context),
               &HVReportingClientServerInstance::carryOutGetServiceName, reporterID,
               std::move(reply));
}

void HVReportingClientServerInstance::setConfiguration(platform::Dictionary configuration,
                                                       ReporterID reporterID, BoolReply reply,
                                                       RequestContext context) {
  applyPrivacy(configuration);
  ResourceCharge charge(account_, configuration.memorySize());
  queueRequest(platform::JobWeight::kBrief, std::move(context),
               [configuration = std::move(configuration), reporterID, reply = std::move(reply),
                charge = std::move(charge)](auto& client) {
                 client.carryOutSetConfiguration(configuration, reporterID, reply);
               });
}

void HVReportingClientServerInstance::startReportingSessionForID(ReporterID reporterID,
                                                                 BoolReply reply,
                                                                 RequestContext context) {
  queueRequest(platform::JobWeight::kMayBlock, std::move(context),
               &HVReportingClientServerInstance::carryOutStart, reporterID, std::move(reply));
}

void HVReportingClientServerInstance::sendMessage(platform::Message message,
                                                  AudioEventCategory category, AudioEventType type,
                                                  ReporterIDs reporterIDs, ErrorReply reply,
                                                  RequestContext context) {
  std::optional<platform::Array> reporters;
  if (reporterIDs.has_value()) {
    std::vector<platform::Value> numbers;
    for (const ReporterID reporterID : *reporterIDs) {
      numbers.emplace_back(static_cast<std::int64_t>(reporterID));
    }
    reporters = platform::Array(numbers);
  }
  auto source = std::make_shared<CallbackSource>(std::move(reply), std::move(context.token));
  postMessage(std::move(message), category, type, std::move(reporters),
              platform::PostedRequest(std::move(source), {.wantsAnswer = true}), context.sender);
  endOfRequests();
}

void HVReportingClientServerInstance::postMessage(platform::Message message,
                                                  AudioEventCategory category, AudioEventType type,
                                                  std::optional<platform::Array> reporterIDs,
                                                  platform::PostedRequest request,
                                                  platform::ProcessID sender) {
  counters_->requests.received.add();
  if (posted_.capacity() == 0) {
    const auto spares = spareMessages().lock();
    if (!spares->empty()) {
      posted_ = std::move(spares->back());
      spares->pop_back();
    }
  }
  applyPrivacy(message);
  ResourceCharge charge(account_, message ? message->memorySize() : 0);
  // The sender's name is looked up here, on the connection's thread, because the sender may have
  // ended by the time the job runs.
  posted_.push_back({std::move(message), category, type, std::move(reporterIDs),
                     senderProcessName(type, sender), std::move(request), std::move(charge)});
}

// Queues one job for all messages that one read of the socket gave. A job for each message, with
// its token and its reply, would take six allocations.
void HVReportingClientServerInstance::endOfRequests() {
  if (posted_.empty()) return;
  reportingQueue()->async(platform::JobWeight::kBrief,
                          [client = shared_from_this(),
                           messages = std::make_shared<Messages>(std::exchange(posted_, {}))] {
                            client->carryOutSends(*messages);
                          });
}

void HVReportingClientServerInstance::carryOutSends(Messages& messages) {
  if (isStopping()) {
    return postpone([client = shared_from_this(),
                     kept = std::make_shared<Messages>(std::exchange(messages, {}))] {
      client->carryOutSends(*kept);
    });
  }
  std::exception_ptr failure;
  for (MessageRequest& message : messages) {
    // Moved out of the list, so that the request is released as soon as its message is sent. The
    // client's next requests are read only while few requests are open.
    MessageRequest request = std::move(message);
    try {
      carryOutSend(request);
      counters_->requests.carriedOut.add();
    } catch (...) {
      // The queue logs the exception. The other messages of the job are still sent.
      failure = std::current_exception();
    }
  }
  messages.clear();
  {
    const auto spares = spareMessages().lock();
    if (spares->size() < kMostSpares && messages.capacity() <= kMostSpareMessages) {
      spares->push_back(std::move(messages));
    }
  }
  if (failure) std::rethrow_exception(failure);
}

Guarded<std::vector<HVReportingClientServerInstance::Messages>>&
HVReportingClientServerInstance::spareMessages() {
  // Never destroyed, because connections may still have work while the process exits.
  static auto* const spares = new Guarded<std::vector<Messages>>;
  return *spares;
}

void HVReportingClientServerInstance::stopReportingSessionForID(ReporterID reporterID,
                                                                BoolReply reply,
                                                                RequestContext context) {
  queueRequest(platform::JobWeight::kMayBlock, std::move(context),
               &HVReportingClientServerInstance::carryOutStop, reporterID, std::move(reply));
}

void HVReportingClientServerInstance::destroyReportingSession(ReporterID reporterID,
                                                              BoolReply reply,
                                                              RequestContext context) {
  queueRequest(platform::JobWeight::kMayBlock, std::move(context),
               &HVReportingClientServerInstance::carryOutDestroy, reporterID, std::move(reply));
}

void HVReportingClientServerInstance::reporterIDValid(ReporterID reporterID, DictionaryReply reply,
                                                      RequestContext context) {
  queueRequest(platform::JobWeight::kBrief, std::move(context),
               &HVReportingClientServerInstance::carryOutReporterIDValid, reporterID,
               std::move(reply));
}

void HVReportingClientServerInstance::getAllReporters(ReportersReply reply,
                                                      RequestContext context) {
  queueRequest(platform::JobWeight::kBrief, std::move(context),
               [reply = std::move(reply)](auto& client) { client.carryOutGetAllReporters(reply); });
}

// Runs on the connection's thread, before everything that is queued. No session is stopped and
// nothing is flushed; this is required.
void HVReportingClientServerInstance::killService(BoolReply /*reply*/) {
  kServiceLog.notice("DESTROYING SERVICE");
  platform::process().terminate(kKilledExitStatus);
}

}  // namespace halvox
