#include "platform/linux/tracing/lttng/LttngPerformanceTraceService.h"

#include <algorithm>
#include <array>
#include <ctime>
#include <optional>
#include <string>
#include <system_error>
#include <utility>
#include <vector>

#include "platform/linux/tracing/TracingLog.h"
#include "platform/linux/tracing/lttng/TraceArchive.h"
#include "platform/services.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::size_t kKeptTraces = 20;
constexpr const char* kTraceStart = "trace-";
constexpr const char* kTraceEnd = ".tar.zst";

struct TemplateConfig final : KQTraceConfig {
  explicit TemplateConfig(std::int32_t templateNumber) : number(templateNumber) {}
  const std::int32_t number;
};

Error traceError(std::string description) {
  return {.domain = "com.tarno.halvox.tracing", .code = 1, .description = std::move(description)};
}

std::string timeText() {
  const std::time_t now = std::time(nullptr);
  std::tm utc{};
  ::gmtime_r(&now, &utc);
  std::array<char, 32> text{};
  const std::size_t length = std::strftime(text.data(), text.size(), "%Y%m%dT%H%M%SZ", &utc);
  return {text.data(), length};
}

// The oldest trace sorts first, because names begin with the time.
void removeOldTraces(const std::filesystem::path& directory) {
  std::vector<std::filesystem::path> traces;
  std::error_code error;
  for (const auto& entry : std::filesystem::directory_iterator(directory, error)) {
    const std::string name = entry.path().filename().string();
    if (name.starts_with(kTraceStart) && name.ends_with(kTraceEnd)) traces.push_back(entry.path());
  }
  if (traces.size() <= kKeptTraces) return;
  std::ranges::sort(traces);
  traces.resize(traces.size() - kKeptTraces);
  for (const auto& trace : traces) std::filesystem::remove(trace, error);
}

}  // namespace

// The work of the service and its sessions. Runs on the service's thread only. Shared with the
// sessions, which may outlive the service object.
struct LttngPerformanceTraceService::Work {
  LttngControl& control;
  ObjectLog log;
  Counter& started;
  Counter& failed;
  Counter& saved;
  Counter& givenUp;
  std::uint64_t saves = 0;

  std::optional<Error> begin(std::optional<LttngControl::Recording>& recording) {
    started.add();
    // LTTng's own events about loaded libraries are not events of a program.
    auto begun = control.begin({.event = "*", .filter = {}, .exclusions = {"lttng_ust_*"}});
    if (!begun) {
      failed.add();
      return traceError(std::move(begun).error().message);
    }
    recording = *std::move(begun);
    return std::nullopt;
  }

  // Called once for each trace that started and was not given up.
  void count(const std::optional<Error>& error) { (error ? failed : saved).add(); }

  std::optional<Error> end(const LttngControl::Recording& recording) {
    auto ended = control.end(recording);
    if (ended) return std::nullopt;
    return traceError(std::move(ended).error().message);
  }

  // Sets the URL of the trace, or returns why there is none.
  std::optional<Error> save(const LttngControl::Recording& recording, std::string& url) {
    // The number distinguishes traces of the same second.
    const std::string name = kTraceStart + timeText() + "-" + std::to_string(++saves) + kTraceEnd;
    const std::filesystem::path archive = control.tracesDirectory() / name;
    const auto packed = packDirectory(recording.directory, archive);
    if (!packed) return traceError("cannot save the trace: " + packed.error().message);
    // Delete old traces only after the new archive is complete, because a failure must not cost an
    // old trace.
    removeOldTraces(control.tracesDirectory());
    url = "file://" + archive.string();
    return std::nullopt;
  }
};

namespace {

using Work = LttngPerformanceTraceService::Work;

// One performance trace. KQTraceSession describes its states. Only the queue uses the recording.
class LttngTraceSession final : public KQTraceSession,
                                public std::enable_shared_from_this<LttngTraceSession> {
 public:
  LttngTraceSession(std::shared_ptr<Work> work, std::shared_ptr<DispatchQueue> queue)
      : work_(std::move(work)), queue_(std::move(queue)) {}
  LttngTraceSession(const LttngTraceSession&) = delete;
  LttngTraceSession& operator=(const LttngTraceSession&) = delete;
  ~LttngTraceSession() override {
    if (!recording_.has_value()) return;
    // The session is no longer used. End the recording and delete it without calling the delegate.
    // Do so on the queue, because ending a recording waits for the tracer.
    queue_->async(JobWeight::kMayBlock, [work = work_, recording = std::move(*recording_)] {
      work->givenUp.add();
      static_cast<void>(work->end(recording));
      work->control.discard(recording);
    });
  }

  void setDelegate(std::weak_ptr<KQTraceSessionDelegate> delegate) override {
    const MutexLock lock(mutex_);
    delegate_ = std::move(delegate);
  }
  void startKQTrace() override {
    queue_->async(JobWeight::kMayBlock, [self = shared_from_this()] { self->start(); });
  }
  void stopKQTrace() override {
    queue_->async(JobWeight::kMayBlock, [self = shared_from_this()] { self->stop(); });
  }

 private:
  std::shared_ptr<KQTraceSessionDelegate> delegate() {
    const MutexLock lock(mutex_);
    return delegate_.lock();
  }

  void start() {
    // A second start of one session would leave the first recording without an owner.
    if (recording_.has_value()) return;
    const auto error = work_->begin(recording_);
    if (const auto listener = delegate()) listener->kqTraceDidStart(error);
  }

  void stop() {
    if (!recording_.has_value()) return;
    const LttngControl::Recording recording = *std::exchange(recording_, std::nullopt);
    auto error = work_->end(recording);
    if (const auto listener = delegate()) listener->kqTraceDidStop(error);
    // Save the trace even if its end failed, because what was recorded until then may still be of
    // use.
    std::string url;
    const auto saveError = work_->save(recording, url);
    work_->control.discard(recording);
    if (!error) error = saveError;
    work_->count(error);
    if (error) {
      work_->log.error("a performance trace failed: ", error->description,
                       "; reporting this to its session");
    }
    if (const auto listener = delegate()) listener->kqTraceDidComplete(url, 0, error);
  }

  const std::shared_ptr<Work> work_;
  const std::shared_ptr<DispatchQueue> queue_;
  std::optional<LttngControl::Recording> recording_;  // used on the queue only
  Mutex mutex_;
  std::weak_ptr<KQTraceSessionDelegate> delegate_ HALVOX_GUARDED_BY(mutex_);
};

}  // namespace

LttngPerformanceTraceService::LttngPerformanceTraceService(LttngControl& control, LogService& log,
                                                           StatisticsService& statistics)
    : work_(std::make_shared<Work>(
          Work{.control = control,
               .log = tracingLog(log, "LttngPerformanceTraceService"),
               .started = statistics.counter("performance traces", "traces started"),
               .failed = statistics.counter("performance traces", "traces that failed"),
               .saved = statistics.counter("performance traces", "traces saved"),
               .givenUp = statistics.counter("performance traces", "traces given up")})) {}

std::shared_ptr<KQTraceConfig> LttngPerformanceTraceService::configWithTemplate(
    std::int32_t number) {
  return std::make_shared<TemplateConfig>(number);
}

std::shared_ptr<KQTraceSession> LttngPerformanceTraceService::initWithConfig(
    std::shared_ptr<KQTraceConfig> /*configuration*/) {
  return std::make_shared<LttngTraceSession>(work_, queue_.get());
}

}  // namespace halvox::platform::linux_
