#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "platform/dispatch.h"
#include "platform/performance_trace.h"
#include "session/Guarded.h"

namespace halvox {

class HVReportingSession;
class SessionProfile;
class TraceRunner;
struct TraceParams;

// The performance traces of one session. A session of type "test" is traced from its start to its
// stop, while the feature is enabled. The configuration chooses the back-end: the service's own
// runner, driven by a trace parameters file, or the platform's performance-trace framework.
//
//   not traced --start--> traced by the runner    --stop: results are written--> not traced
//              --start--> traced by the framework --stop: trace has completed--> not traced
//
// The stop chooses the back-end again. If the configuration or the type changed meanwhile, it may
// stop the wrong one or none; the trace then stays until the next start or the session's end.
//
// Owned by the session, which starts and stops it on the thread of its own start and stop. The
// framework calls back on a thread of its own. Failures are logged, and the session runs untraced.
class SessionTracing : public platform::KQTraceSessionDelegate {
 public:
  using Owner = std::shared_ptr<const HVReportingSession>;

  // `profile` must outlive this.
  explicit SessionTracing(const SessionProfile& profile);
  SessionTracing(const SessionTracing&) = delete;
  SessionTracing& operator=(const SessionTracing&) = delete;
  ~SessionTracing() override = default;

  // Does nothing unless the feature is enabled, the session is a test and is not traced yet. Keeps
  // `owner` weakly. Waits for the disk if the runner is chosen.
  void start(const Owner& owner);
  // Blocks, without a time-out, until the trace is complete and saved. Does nothing unless the
  // feature is enabled, the session is a test and is traced.
  void stop();

  [[nodiscard]] bool startedTracing() const {
    return startedTracing_.load(std::memory_order_acquire);
  }
  // The trace parameters file that was set up last, its contents, and the runner made from them.
  [[nodiscard]] std::string tracingFileName() const { return state_.lock()->fileName; }
  [[nodiscard]] std::shared_ptr<const TraceParams> traceParams() const {
    return state_.lock()->params;
  }
  [[nodiscard]] std::shared_ptr<TraceRunner> traceRunner() const { return state_.lock()->runner; }
  // The framework's trace that is being recorded; null if there is none.
  [[nodiscard]] std::shared_ptr<platform::KQTraceConfig> traceConfig() const {
    return state_.lock()->config;
  }
  [[nodiscard]] std::shared_ptr<platform::KQTraceSession> traceSession() const {
    return state_.lock()->session;
  }
  // Where the framework's last finished trace is; none before one has finished.
  [[nodiscard]] std::optional<std::string> getKQTraceFileURL() const {
    return state_.lock()->finalURL;
  }

  // Reads a trace parameters file and makes a runner from it. Logs failures; an empty path makes no
  // runner. Waits for the disk.
  void setupTracing(const std::string& path);

  // The framework's reports about its trace, on a thread of its own. A stop waits for the
  // completion.
  void kqTraceDidStart(const std::optional<platform::Error>& error) override;
  void kqTraceDidStop(const std::optional<platform::Error>& error) override;
  void kqTraceDidComplete(const std::string& url, std::uint64_t token,
                          const std::optional<platform::Error>& error) override;

 private:
  struct State {
    std::string fileName{};
    std::shared_ptr<const TraceParams> params{};
    std::shared_ptr<TraceRunner> runner{};
    std::shared_ptr<platform::KQTraceConfig> config{};
    std::shared_ptr<platform::KQTraceSession> session{};
    std::optional<std::string> finalURL{};
  };

  void setStartedTracing(bool started) {
    startedTracing_.store(started, std::memory_order_release);
  }
  std::shared_ptr<TraceRunner> runnerForThisRun();
  void startFrameworkTrace(const Owner& owner);

  const SessionProfile& profile_;  // the session's
  // Receives one signal for each completed trace of the framework.
  const std::shared_ptr<platform::DispatchSemaphore> mTraceDispatchSemaphore_;
  Guarded<State> state_;
  std::atomic<bool> startedTracing_{false};  // orders what the start of a trace wrote
};

}  // namespace halvox
