#include "session/SessionTracing.h"

#include <string_view>
#include <utility>

#include "backends/HVReportingVocabulary.h"
#include "platform/feature_flags.h"
#include "platform/log.h"
#include "platform/services.h"
#include "session/SessionLog.h"
#include "session/SessionProfile.h"
#include "session/TraceConstants.h"
#include "tracing/TraceLog.h"
#include "tracing/TraceParamsParser.h"
#include "tracing/TraceRunner.h"

namespace halvox {

const platform::StringConstant HVReportingTraceTypeKtrace{"ktrace"};

namespace {

using platform::Error;
using platform::PerformanceTraceService;

// The log of the framework's callbacks.
constexpr platform::UnitLog kTraceLog(&HVReportingTraceCategory, "HVReportingSession");

bool isTracingOn() {
  return platform::featureFlags()._os_feature_enabled_impl("Acoustat", "Tracing");
}

// True if the configuration chooses the runner. Compares the identity of the text, not its
// spelling, and this is required: any other text that spells "ktrace" chooses the framework, and a
// missing entry does too. A client's text works because the decoder turns "ktrace" into the
// constant.
bool choosesRunner(const platform::Dictionary& configuration) {
  const platform::Value* type = configuration.find(HVReportingTraceType);
  return type != nullptr && type->isIdenticalTo(HVReportingTraceTypeKtrace);
}

std::shared_ptr<TraceRunner> makeRunner(const TraceParams* params) {
  auto runner = std::make_shared<TraceRunner>();
  runner->createTraceFromTraceParams(params);
  return runner;
}

// The URL without "file://".
std::string_view pathOfURL(std::string_view url) {
  constexpr std::string_view kScheme = "file://";
  if (url.starts_with(kScheme)) url.remove_prefix(kScheme.size());
  return url;
}

}  // namespace

SessionTracing::SessionTracing(const SessionProfile& profile)
    : profile_(profile), mTraceDispatchSemaphore_(platform::dispatch().createSemaphore(0)) {}

// The session is marked as traced before the trace is asked to start, because a trace may begin and
// fail before that call returns.
void SessionTracing::start(const Owner& owner) {
  if (!isTracingOn() || startedTracing() || profile_.serviceType() != AudioServiceType::kTest) {
    return;
  }
  const platform::Dictionary settings = profile_.configuration();
  if (!choosesRunner(settings)) {
    startFrameworkTrace(owner);
    return;
  }
  const platform::Value* path = settings.find(HVReportingMeridelPlistFilePath);
  if (path == nullptr) return;
  const std::string file = platform::describe(*path);
  kSessionLog.debug("Got the tracefile ", file, ", setting up trace");
  setupTracing(file);
  if (const auto runner = runnerForThisRun()) {
    setStartedTracing(true);
    runner->runTraces();
  }
}

// Returns the runner that setupTracing() has just made. If the path was empty, setupTracing() made
// none, and the parameters of an earlier run are traced again. They need a new runner, because a
// runner records once and its results must be those of this run alone. Null if no parameters were
// ever set up.
std::shared_ptr<TraceRunner> SessionTracing::runnerForThisRun() {
  auto current = traceRunner();
  if (current == nullptr || current->canRun()) return current;
  auto fresh = makeRunner(traceParams().get());
  state_.lock()->runner = fresh;
  return fresh;
}

void SessionTracing::setupTracing(const std::string& path) {
  if (path.empty()) {
    kSessionLog.error("TracefileName empty. Failed to setup tracing");
    return;
  }
  auto params = std::make_shared<const TraceParams>(TraceParamsParser(path).loadTraceParams());
  auto runner = makeRunner(params.get());
  {
    const auto state = state_.lock();
    state->fileName = path;
    state->params = std::move(params);
    state->runner.swap(runner);  // destroys the former runner after the lock
  }
  // The mark is cleared here, and this is required: the start marks the session as traced only when
  // a runner exists.
  setStartedTracing(false);
  kSessionLog.info("Setting up tracing for ", profile_.serviceName());
}

void SessionTracing::startFrameworkTrace(const Owner& owner) {
  PerformanceTraceService& traces = platform::performanceTraces();
  auto config = traces.configWithTemplate(PerformanceTraceService::kStandardTemplate);
  const auto trace = traces.initWithConfig(config);
  auto former = trace;
  {
    const auto state = state_.lock();
    state->config = std::move(config);
    state->session.swap(former);
  }
  // If the stop of the former trace chose the runner, the former trace still records. It ends when
  // this function releases it. Its delegate is removed first, because its callbacks would otherwise
  // be taken for those of the new trace.
  if (former != nullptr) former->setDelegate({});
  trace->setDelegate(std::shared_ptr<SessionTracing>(owner, this));
  setStartedTracing(true);
  trace->startKQTrace();
}

void SessionTracing::stop() {
  if (!isTracingOn() || !startedTracing() || profile_.serviceType() != AudioServiceType::kTest) {
    return;
  }
  setStartedTracing(false);
  // The trace type may have changed since the start. Stopping a runner that does not record does
  // nothing.
  if (choosesRunner(profile_.configuration())) {
    if (const auto runner = traceRunner()) runner->stopTracingandProcessResults();
    return;
  }
  if (const auto trace = traceSession()) trace->stopKQTrace();
  // Waits until the trace has completed. There is no time-out, and this is required. If the trace
  // failed to start, it never completes, and this function never returns.
  mTraceDispatchSemaphore_->wait();
}

void SessionTracing::kqTraceDidStart(const std::optional<Error>& error) {
  platform::log()
      .createCategory(kHVReportingLogSubsystem, "general")
      .write(platform::LogLevel::kDefault, "started performance trace.");
  if (!error.has_value()) {
    kTraceLog.info("Performance Trace Started");
    return;
  }
  {
    const auto state = state_.lock();
    // The session stays marked as traced, so that its stop waits for a completion that never comes.
    // This is required; see stop().
    state->session = nullptr;
    state->config = nullptr;
  }
  kTraceLog.error("kqTraceDidStart ", error->description);
}

void SessionTracing::kqTraceDidStop(const std::optional<Error>& error) {
  if (!error.has_value()) {
    kTraceLog.info("Performance Trace Stopped");
    return;
  }
  state_.lock()->session = nullptr;
  kTraceLog.error("kqTraceDidStop ", error->description);
}

void SessionTracing::kqTraceDidComplete(const std::string& url, std::uint64_t /*token*/,
                                        const std::optional<Error>& error) {
  // The trace is released before the signal and the URL is stored after it; this order is required.
  // A stop that waits for the signal may therefore return before the URL is there.
  const auto trace = std::exchange(state_.lock()->session, nullptr);
  if (trace != nullptr) trace->setDelegate({});
  mTraceDispatchSemaphore_->signal();
  if (error.has_value()) {
    kTraceLog.error("kqTraceDidComplete ", error->description);
    return;
  }
  state_.lock()->finalURL = url;
  kTraceLog.info("Performance Trace Completed: ", pathOfURL(url));
}

}  // namespace halvox
