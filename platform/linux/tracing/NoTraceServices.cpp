#include "platform/linux/tracing/NoTraceServices.h"

#include <cstdint>
#include <functional>
#include <memory>
#include <utility>

#include "platform/linux/base/Mutex.h"
#include "platform/linux/tracing/QueueOnDemand.h"

namespace halvox::platform::linux_ {
namespace {

constexpr int kNoTracer = 1;

struct NoSession final : KtraceSession {
  enum class State : std::uint8_t { kMade, kStarted, kEnded, kDestroyed };
  State state = State::kMade;
  std::function<void()> completion;
  std::shared_ptr<DispatchQueue> queue;
};
using State = NoSession::State;

// The session if it is in that state; null otherwise.
std::shared_ptr<NoSession> own(const KtraceService::Session& session, State state) {
  auto ours = std::dynamic_pointer_cast<NoSession>(session);
  return ours != nullptr && ours->state == state ? ours : nullptr;
}

// Kernel traces that cannot be started. They still follow the states of KtraceService: an end
// completes them, because the stop of a reporting session waits for the completion.
class NoKtraceService final : public KtraceService {
 public:
  Session ktrace_session_create() override { return std::make_shared<NoSession>(); }
  void ktrace_set_completion_handler(const Session& session,
                                     std::function<void()> handler) override {
    if (const auto ours = own(session, State::kMade)) ours->completion = std::move(handler);
  }
  void ktrace_set_walltimes_enabled(const Session& /*session*/, bool /*enabled*/) override {}
  int ktrace_events_range(const Session& /*session*/, std::uint32_t /*low*/, std::uint32_t /*high*/,
                          EventHandler /*handler*/) override {
    return kNoTracer;
  }
  int ktrace_start(const Session& session, std::shared_ptr<DispatchQueue> queue) override {
    const auto ours = own(session, State::kMade);
    if (ours == nullptr || queue == nullptr) return kNoTracer;
    // The trace counts as started although this returns an error, because the caller ends it and
    // waits for the completion.
    ours->state = State::kStarted;
    ours->queue = std::move(queue);
    return kNoTracer;
  }
  void ktrace_end(const Session& session, int /*reason*/) override {
    const auto ours = own(session, State::kStarted);
    if (ours == nullptr) return;
    ours->state = State::kEnded;
    ours->queue->async(JobWeight::kMayBlock, [ours] {
      // Move the handler out first, because it may destroy the session, which would destroy the
      // handler.
      if (const auto completion = std::exchange(ours->completion, nullptr)) completion();
    });
  }
  void ktrace_session_destroy(const Session& session) override {
    const auto ours = std::dynamic_pointer_cast<NoSession>(session);
    if (ours == nullptr) return;
    ours->state = State::kDestroyed;
    ours->completion = nullptr;
  }
  [[nodiscard]] std::uint64_t ktrace_convert_timestamp_to_nanoseconds(
      const Session& /*session*/, std::uint64_t timestamp) const override {
    return timestamp;
  }
};

// Reports from its queue that it cannot start, because a delegate must not be called inside a call
// to the session.
class NoTraceSession final : public KQTraceSession,
                             public std::enable_shared_from_this<NoTraceSession> {
 public:
  NoTraceSession(std::shared_ptr<DispatchQueue> queue, std::string reason)
      : queue_(std::move(queue)), reason_(std::move(reason)) {}

  void setDelegate(std::weak_ptr<KQTraceSessionDelegate> delegate) override {
    const MutexLock lock(mutex_);
    delegate_ = std::move(delegate);
  }
  void startKQTrace() override {
    queue_->async(JobWeight::kMayBlock, [self = shared_from_this()] {
      const auto delegate = self->delegate();
      if (delegate == nullptr) return;
      delegate->kqTraceDidStart(Error{
          .domain = "com.tarno.halvox.tracing", .code = kNoTracer, .description = self->reason_});
    });
  }
  void stopKQTrace() override {}

 private:
  std::shared_ptr<KQTraceSessionDelegate> delegate() {
    const MutexLock lock(mutex_);
    return delegate_.lock();
  }

  const std::shared_ptr<DispatchQueue> queue_;
  const std::string reason_;
  Mutex mutex_;
  std::weak_ptr<KQTraceSessionDelegate> delegate_ HALVOX_GUARDED_BY(mutex_);
};

class NoPerformanceTraceService final : public PerformanceTraceService {
 public:
  explicit NoPerformanceTraceService(std::string reason) : reason_(std::move(reason)) {}

  std::shared_ptr<KQTraceConfig> configWithTemplate(std::int32_t /*number*/) override {
    return std::make_shared<KQTraceConfig>();
  }
  std::shared_ptr<KQTraceSession> initWithConfig(
      std::shared_ptr<KQTraceConfig> /*configuration*/) override {
    return std::make_shared<NoTraceSession>(queue_.get(), reason_);
  }
  // Releases the queue. Call it after the queues have ended.
  void close() { queue_.release(); }

 private:
  const std::string reason_;
  QueueOnDemand queue_{{"Performance Trace", QualityOfService::kUtility, QueueThreading::kShared}};
};

class NoTraceServices final : public TraceServices {
 public:
  explicit NoTraceServices(const std::string& reason)
      : performanceTraces_(reason), description_("none, " + reason) {}

  KtraceService& ktrace() override { return ktrace_; }
  PerformanceTraceService& performanceTraces() override { return performanceTraces_; }
  void open() override {}
  void stop() override {}
  void close() override { performanceTraces_.close(); }
  void abandon() override {}
  [[nodiscard]] std::string description() const override { return description_; }

 private:
  NoKtraceService ktrace_;
  NoPerformanceTraceService performanceTraces_;
  const std::string description_;
};

}  // namespace

std::unique_ptr<TraceServices> makeNoTraceServices(const std::string& reason) {
  return std::make_unique<NoTraceServices>(reason);
}

}  // namespace halvox::platform::linux_
