#include "platform/fake/FakeDiagnosticReporterService.h"

#include <stdexcept>
#include <utility>

namespace halvox::platform {

struct FakeDiagnosticReporterService::Requests {
  explicit Requests(Journal& to) : journal(to) {}
  Journal& journal;  // outlives every call of a reporter
  std::mutex mutex;
  std::vector<Request> asked;
  std::vector<AILDiagnosticReporter::Reply> replies;  // by request; empty once the reply was given
};

class FakeDiagnosticReporterService::Reporter final : public AILDiagnosticReporter {
 public:
  explicit Reporter(std::shared_ptr<Requests> requests) : requests_(std::move(requests)) {}

  Dictionary makeSignature(std::string_view domain, std::string_view type, std::string_view subType,
                           std::string_view subtypeContext,
                           std::optional<std::string_view> detectedProcess,
                           const std::optional<Dictionary>& triggerThresholdValues) const override {
    Dictionary signature{{"domain", domain},
                         {"type", type},
                         {"subType", subType},
                         {"subtypeContext", subtypeContext}};
    if (detectedProcess.has_value()) signature.set("detectedProcess", *detectedProcess);
    if (triggerThresholdValues.has_value()) {
      signature.set("triggerThresholdValues", *triggerThresholdValues);
    }
    return signature;
  }

  void requestSnapshot(const Dictionary& signature, double durationSeconds,
                       const std::optional<Dictionary>& event,
                       const std::optional<Dictionary>& payload, Reply reply) override {
    requests_->journal.record(JournalKind::kSnapshotRequest, describe(signature));
    const std::lock_guard lock(requests_->mutex);
    requests_->asked.push_back({this, signature, durationSeconds, event, payload});
    requests_->replies.push_back(std::move(reply));
  }

 private:
  const std::shared_ptr<Requests> requests_;
};

FakeDiagnosticReporterService::FakeDiagnosticReporterService(Journal& journal)
    : requests_(std::make_shared<Requests>(journal)) {}

FakeDiagnosticReporterService::~FakeDiagnosticReporterService() = default;

std::size_t FakeDiagnosticReporterService::reportersMade() const {
  const std::lock_guard lock(mutex_);
  return made_;
}

std::vector<FakeDiagnosticReporterService::Request> FakeDiagnosticReporterService::requests()
    const {
  const std::lock_guard lock(requests_->mutex);
  return requests_->asked;
}

void FakeDiagnosticReporterService::reply(std::size_t index, const Dictionary& response) {
  AILDiagnosticReporter::Reply reply;
  {
    const std::lock_guard lock(requests_->mutex);
    reply = std::exchange(requests_->replies.at(index), nullptr);
  }
  if (!reply) throw std::logic_error("this request has already been answered");
  reply(response);
}

std::optional<Dictionary> FakeDiagnosticReporterService::state() const {
  const auto answer = std::make_shared<std::optional<Dictionary>>();
  askState([answer](const Dictionary& state) { *answer = state; });
  return *answer;
}

void FakeDiagnosticReporterService::askState(
    std::function<void(const Dictionary& state)> callback) const {
  StateSource source;
  {
    const std::lock_guard lock(mutex_);
    source = stateSource_;
  }
  if (source) source(std::move(callback));
}

std::shared_ptr<AILDiagnosticReporter> FakeDiagnosticReporterService::createReporter() {
  const std::lock_guard lock(mutex_);
  ++made_;
  return std::make_shared<Reporter>(requests_);
}

void FakeDiagnosticReporterService::setStateSource(StateSource source) {
  const std::lock_guard lock(mutex_);
  stateSource_ = std::move(source);
}

}  // namespace halvox::platform
