#include <string>
#include <utility>

#include "platform/feature_flags.h"
#include "platform/log.h"
#include "platform/services.h"
#include "session/HVReportingSession.h"
#include "session/SessionLog.h"
#include "session/TraceConstants.h"
#include "tracing/TraceLog.h"
#include "tracing/TraceParamsParser.h"
#include "tracing/TraceRunner.h"

// The performance traces of test sessions: the service's own runner, driven by a trace parameters
// file, or the platform's performance-trace framework.
namespace halvox {

const platform::StringConstant HVReportingTraceTypeKtrace{"ktrace"};

namespace {

using platform::Error;
using platform::PerformanceTraceService;

// What the callbacks of the framework log with.
constexpr platform::UnitLog kTraceLog(&HVReportingTraceCategory, "HVReportingSession");

// The general log of the service, for a plain line of no unit.
platform::LogCategory& generalCategory() {
  static platform::LogCategory& category =
      platform::log().createCategory(kHVReportingLogSubsystem, "general");
  return category;
}

bool isTracingOn() {
  return platform::featureFlags()._os_feature_enabled_impl("Acoustat", "Tracing");
}

// Whether the runner is chosen. The test is one of identity and kept so: a text that merely spells
// "ktrace" chooses the framework, and so does no text at all.
bool choosesRunner(const platform::Dictionary& configuration) {
  const platform::Value* type = configuration.find(HVReportingTraceType);
  return type != nullptr && type->isIdenticalTo(HVReportingTraceTypeKtrace);
}

std::shared_ptr<TraceRunner> makeRunner(const TraceParams* params) {
  auto runner = std::make_shared<TraceRunner>();
  runner->createTraceFromTraceParams(params);
  return runner;
}

// What follows the scheme of a file's URL.
std::string_view pathOfURL(std::string_view url) {
  constexpr std::string_view kScheme = "file://";
  if (url.starts_with(kScheme)) url.remove_prefix(kScheme.size());
  return url;
}

}  // namespace

void HVReportingSession::startTracing() {
  if (!isTracingOn() || startedTracing() || serviceType() != AudioServiceType::kTest) return;
  const platform::Dictionary settings = configuration();
  if (!choosesRunner(settings)) {
    startFrameworkTrace();
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

// The one that was just set up. If the set-up failed, the parameters of an earlier run are traced
// again, by a runner of their own, so that its results are those of this run alone. Null when there
// are none.
std::shared_ptr<TraceRunner> HVReportingSession::runnerForThisRun() {
  auto current = traceRunner();
  if (current == nullptr || current->canRun()) return current;
  auto fresh = makeRunner(traceParams().get());
  tracing_.lock()->runner = fresh;
  return fresh;
}

void HVReportingSession::setupTracing(const std::string& path) {
  if (path.empty()) {
    kSessionLog.error("TracefileName empty. Failed to setup tracing");
    return;
  }
  auto params = std::make_shared<const TraceParams>(TraceParamsParser(path).loadTraceParams());
  auto runner = makeRunner(params.get());
  {
    const auto tracing = tracing_.lock();
    tracing->fileName = path;
    tracing->params = std::move(params);
    tracing->runner.swap(runner);  // the former one goes without the lock
  }
  setStartedTracing(false);
  kSessionLog.info("Setting up tracing for ", serviceName());
}

void HVReportingSession::startFrameworkTrace() {
  PerformanceTraceService& traces = platform::performanceTraces();
  auto config = traces.configWithTemplate(PerformanceTraceService::kStandardTemplate);
  const auto trace = traces.initWithConfig(config);
  auto former = trace;
  {
    const auto tracing = tracing_.lock();
    tracing->config = std::move(config);
    tracing->session.swap(former);
  }
  // One that was never stopped, because its stop chose the runner, ends with its last holder. What
  // it still has to say is not about the new one.
  if (former != nullptr) former->setDelegate({});
  trace->setDelegate(weak_from_this());
  setStartedTracing(true);
  trace->startKQTrace();
}

void HVReportingSession::stopTracing() {
  if (!isTracingOn() || !startedTracing() || serviceType() != AudioServiceType::kTest) return;
  setStartedTracing(false);
  // The type may have changed since the start. A runner that does not record has nothing to stop.
  if (choosesRunner(configuration())) {
    if (const auto runner = traceRunner()) runner->stopTracingandProcessResults();
    return;
  }
  if (const auto trace = traceSession()) trace->stopKQTrace();
  // Until the trace has completed, however long that takes. A trace whose start failed never
  // completes, and then this never ends: there is no time limit, on purpose.
  mTraceDispatchSemaphore_->wait();
}

void HVReportingSession::kqTraceDidStart(const std::optional<Error>& error) {
  generalCategory().write(platform::LogLevel::kDefault, "started performance trace.");
  if (!error.has_value()) {
    kTraceLog.info("Performance Trace Started");
    return;
  }
  {
    const auto tracing = tracing_.lock();
    tracing->session = nullptr;
    tracing->config = nullptr;
  }
  kTraceLog.error("kqTraceDidStart ", error->description);
}

void HVReportingSession::kqTraceDidStop(const std::optional<Error>& error) {
  if (!error.has_value()) {
    kTraceLog.info("Performance Trace Stopped");
    return;
  }
  tracing_.lock()->session = nullptr;
  kTraceLog.error("kqTraceDidStop ", error->description);
}

void HVReportingSession::kqTraceDidComplete(const std::string& url, std::uint64_t /*token*/,
                                            const std::optional<Error>& error) {
  const auto trace = std::exchange(tracing_.lock()->session, nullptr);
  if (trace != nullptr) trace->setDelegate({});
  mTraceDispatchSemaphore_->signal();
  if (error.has_value()) {
    kTraceLog.error("kqTraceDidComplete ", error->description);
    return;
  }
  tracing_.lock()->finalURL = url;
  kTraceLog.info("Performance Trace Completed: ", pathOfURL(url));
}

}  // namespace halvox
