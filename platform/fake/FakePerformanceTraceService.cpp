#include "platform/fake/FakePerformanceTraceService.h"

#include <utility>

namespace halvox::platform {
namespace {

std::optional<Error> failure(const std::string& description) {
  if (description.empty()) return std::nullopt;
  return Error{.domain = "fake", .code = 1, .description = description};
}

}  // namespace

class FakePerformanceTraceService::Session final : public KQTraceSession,
                                                   public std::enable_shared_from_this<Session> {
 public:
  Session(FakePerformanceTraceService& service, std::shared_ptr<DispatchQueue> queue)
      : service_(service), queue_(std::move(queue)) {}
  Session(const Session&) = delete;
  Session& operator=(const Session&) = delete;
  ~Session() override {
    if (isRecording_) service_.giveUp();
  }

  void setDelegate(std::weak_ptr<KQTraceSessionDelegate> delegate) override {
    service_.journal_.note(delegate.expired() ? "trace without delegate" : "trace delegate");
    const std::lock_guard lock(mutex_);
    delegate_ = std::move(delegate);
  }
  void startKQTrace() override {
    service_.journal_.note("trace start");
    queue_->async(JobWeight::kMayBlock, [self = shared_from_this()] { self->start(); });
  }
  void stopKQTrace() override {
    service_.journal_.note("trace stop");
    queue_->async(JobWeight::kMayBlock, [self = shared_from_this()] { self->stop(); });
  }
  [[nodiscard]] std::shared_ptr<KQTraceSessionDelegate> delegate() const {
    const std::lock_guard lock(mutex_);
    return delegate_.lock();
  }

 private:
  void start() {
    if (isRecording_ || service_.isHanging()) return;
    const std::optional<Error> error = service_.begin();
    isRecording_ = !error.has_value();
    if (const auto listener = delegate()) listener->kqTraceDidStart(error);
  }
  void stop() {
    if (!isRecording_ || service_.isHanging()) return;
    isRecording_ = false;
    const Outcome outcome = service_.end();
    if (const auto listener = delegate()) listener->kqTraceDidStop(outcome.stopError);
    if (const auto listener = delegate()) {
      listener->kqTraceDidComplete(outcome.url, 0, outcome.error);
    }
  }

  FakePerformanceTraceService& service_;
  const std::shared_ptr<DispatchQueue> queue_;
  bool isRecording_ = false;  // used by the queue's jobs, and after them by the destructor
  mutable std::mutex mutex_;
  std::weak_ptr<KQTraceSessionDelegate> delegate_;
};

void FakePerformanceTraceService::failStarts(std::string description) {
  const std::lock_guard lock(mutex_);
  startFailure_ = std::move(description);
}

void FakePerformanceTraceService::failStops(std::string description) {
  const std::lock_guard lock(mutex_);
  stopFailure_ = std::move(description);
}

void FakePerformanceTraceService::failSaves(std::string description) {
  const std::lock_guard lock(mutex_);
  saveFailure_ = std::move(description);
}

void FakePerformanceTraceService::hang() {
  const std::lock_guard lock(mutex_);
  hangs_ = true;
}

void FakePerformanceTraceService::completeAtStop(std::string url) {
  const std::lock_guard lock(mutex_);
  url_ = std::move(url);
}

std::shared_ptr<KQTraceSessionDelegate> FakePerformanceTraceService::delegate() const {
  std::shared_ptr<Session> session;
  {
    const std::lock_guard lock(mutex_);
    session = newest_.lock();
  }
  return session == nullptr ? nullptr : session->delegate();
}

std::vector<std::int32_t> FakePerformanceTraceService::templates() const {
  const std::lock_guard lock(mutex_);
  return templates_;
}

std::size_t FakePerformanceTraceService::recordings() const {
  const std::lock_guard lock(mutex_);
  return recordings_;
}

std::shared_ptr<KQTraceConfig> FakePerformanceTraceService::configWithTemplate(
    std::int32_t number) {
  journal_.note("trace configuration");
  const std::lock_guard lock(mutex_);
  templates_.push_back(number);
  return std::make_shared<KQTraceConfig>();
}

std::shared_ptr<KQTraceSession> FakePerformanceTraceService::initWithConfig(
    std::shared_ptr<KQTraceConfig> /*configuration*/) {
  journal_.note("trace session");
  auto session = std::make_shared<Session>(*this, queue());
  const std::lock_guard lock(mutex_);
  newest_ = session;
  return session;
}

std::shared_ptr<DispatchQueue> FakePerformanceTraceService::queue() {
  const std::lock_guard lock(mutex_);
  if (queue_ == nullptr) {
    queue_ = dispatch_.createSerialQueue("Performance Trace", QualityOfService::kUtility,
                                         QueueThreading::kOwnThread);
  }
  return queue_;
}

std::optional<Error> FakePerformanceTraceService::begin() {
  const std::lock_guard lock(mutex_);
  if (startFailure_.empty()) ++recordings_;
  return failure(startFailure_);
}

bool FakePerformanceTraceService::isHanging() const {
  const std::lock_guard lock(mutex_);
  return hangs_;
}

FakePerformanceTraceService::Outcome FakePerformanceTraceService::end() {
  const std::lock_guard lock(mutex_);
  --recordings_;
  Outcome outcome{.stopError = failure(stopFailure_), .error = failure(stopFailure_)};
  if (!outcome.error) outcome.error = failure(saveFailure_);
  if (!outcome.error) {
    ++completed_;
    outcome.url = url_.empty() ? "file:///traces/" + std::to_string(completed_) : url_;
  }
  return outcome;
}

void FakePerformanceTraceService::giveUp() {
  const std::lock_guard lock(mutex_);
  --recordings_;
}

}  // namespace halvox::platform
