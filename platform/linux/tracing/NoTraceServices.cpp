#include <functional>
#include <utility>

#include "platform/linux/tracing/TraceServices.h"

namespace halvox::platform::linux_ {
namespace {

constexpr int kNoTracer = 1;

struct NoSession final : KtraceSession {
  std::function<void()> completion;
  std::shared_ptr<DispatchQueue> queue;
};

NoSession& own(const KtraceService::Session& session) { return dynamic_cast<NoSession&>(*session); }

// Sessions that cannot be started, and complete when they are ended.
class NoKtraceService final : public KtraceService {
 public:
  Session ktrace_session_create() override { return std::make_shared<NoSession>(); }
  void ktrace_set_completion_handler(const Session& session,
                                     std::function<void()> handler) override {
    own(session).completion = std::move(handler);
  }
  void ktrace_set_walltimes_enabled(const Session& /*session*/, bool /*enabled*/) override {}
  int ktrace_events_range(const Session& /*session*/, std::uint32_t /*low*/, std::uint32_t /*high*/,
                          EventHandler /*handler*/) override {
    return kNoTracer;
  }
  int ktrace_start(const Session& session, std::shared_ptr<DispatchQueue> queue) override {
    own(session).queue = std::move(queue);
    return kNoTracer;
  }
  void ktrace_end(const Session& session, int /*reason*/) override {
    const auto queue = std::exchange(own(session).queue, nullptr);
    auto completion = std::exchange(own(session).completion, nullptr);
    if (queue && completion) queue->async(JobWeight::kMayBlock, std::move(completion));
  }
  void ktrace_session_destroy(const Session& /*session*/) override {}
  [[nodiscard]] std::uint64_t ktrace_convert_timestamp_to_nanoseconds(
      const Session& /*session*/, std::uint64_t timestamp) const override {
    return timestamp;
  }
};

class NoTraceSession final : public KQTraceSession {
 public:
  void setDelegate(std::weak_ptr<KQTraceSessionDelegate> delegate) override {
    delegate_ = std::move(delegate);
  }
  void startKQTrace() override {
    const auto delegate = delegate_.lock();
    if (delegate == nullptr) return;
    delegate->kqTraceDidStart(Error{.domain = "com.tarno.halvox.tracing",
                                    .code = kNoTracer,
                                    .description = "LTTng is not in this build"});
  }
  void stopKQTrace() override {}

 private:
  std::weak_ptr<KQTraceSessionDelegate> delegate_;
};

class NoPerformanceTraceService final : public PerformanceTraceService {
 public:
  std::shared_ptr<KQTraceConfig> configWithTemplate(std::int32_t /*number*/) override {
    return std::make_shared<KQTraceConfig>();
  }
  std::shared_ptr<KQTraceSession> initWithConfig(
      std::shared_ptr<KQTraceConfig> /*configuration*/) override {
    return std::make_shared<NoTraceSession>();
  }
};

class NoTraceServices final : public TraceServices {
 public:
  KtraceService& ktrace() override { return ktrace_; }
  PerformanceTraceService& performanceTraces() override { return performanceTraces_; }
  void open() override {}
  void stop() override {}
  void close() override {}
  void abandon() override {}
  [[nodiscard]] std::string description() const override { return "none, LTTng not in this build"; }

 private:
  NoKtraceService ktrace_;
  NoPerformanceTraceService performanceTraces_;
};

}  // namespace

std::unique_ptr<TraceServices> makeTraceServices(const std::filesystem::path& /*storageDirectory*/,
                                                 StatisticsService& /*statistics*/) {
  return std::make_unique<NoTraceServices>();
}

}  // namespace halvox::platform::linux_
