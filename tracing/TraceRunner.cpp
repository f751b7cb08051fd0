#include "tracing/TraceRunner.h"

#include <algorithm>
#include <cstdlib>
#include <optional>
#include <string>
#include <utility>

#include "platform/files.h"
#include "platform/process.h"
#include "platform/results_file.h"
#include "platform/services.h"
#include "tracing/TraceLog.h"

namespace halvox {
namespace {

constexpr platform::UnitLog kLog(&HVReportingTraceCategory, "TraceRunner");

constexpr std::string_view kResultsFileName = "tracing_results.ssj";
constexpr std::string_view kProductName = "HVReporting";
constexpr std::uint32_t kResultsVersion = 4;
constexpr std::uint32_t kNoFlags = 0;
constexpr std::uint32_t kDirectoryPermissions = 0777;
constexpr std::string_view kQueueLabel = "Tracing Queue";
// The identifiers that are recorded.
constexpr std::uint32_t kFirstIdentifier = 0x21040000;
constexpr std::uint32_t kLastIdentifier = 0x2104408A;
constexpr std::size_t kExpectedEvents = 10'000;

}  // namespace

TraceRunner::TraceRunner()
    : queue_(platform::dispatch().createSerialQueue(
          // A stop waits for it on the reporting queue, so it must not run after what gives way.
          kQueueLabel, platform::QualityOfService::kUserInteractive,
          platform::QueueThreading::kOwnThread)),
      completion_(platform::dispatch().createSemaphore(0)) {}

// A runner can go while it records, when its session is replaced by another without a stop. What
// still records has handlers that lead here.
TraceRunner::~TraceRunner() {
  for (const auto& [trace, session] : sessions_) {
    if (session != nullptr) platform::ktrace().ktrace_session_destroy(session);
  }
}

std::uint32_t TraceRunner::getResultsVersion() { return kResultsVersion; }

void TraceRunner::createTraceFromTraceParams(const TraceParams* params) {
  if (params == nullptr) {
    kLog.notice("Attempted to add nullptr to trace runner");
    return;
  }
  auto trace = std::make_unique<Trace>(params->name, params->type == TraceType::kKernelTrace
                                                         ? Trace::Kind::kKernelTrace
                                                         : Trace::Kind::kSignpost);
  for (const TraceDataParams& point : params->tracePoints) {
    trace->addTraceDataToCollect(std::make_unique<TraceInterval>(
        point.name,
        TraceIntervalCodes{
            .begin = point.beginCode, .end = point.endCode, .matchByThread = point.matchByThread}));
  }
  events_[trace.get()].reserve(kExpectedEvents);
  traces_.push_back(std::move(trace));
}

void TraceRunner::runTraces() {
  kLog.info("Number of traces to perform: ", traces_.size());
  for (const auto& trace : traces_) {
    kLog.info("Performing trace : ", trace->name());
    if (!trace->isKernelTrace()) continue;
    kLog.info("Setting up tracing: ", trace->name());
    setupTracing(*trace);
    kLog.info("Starting tracing: ", trace->name());
    startTracing(*trace);
  }
}

void TraceRunner::setupTracing(Trace& trace) {
  platform::KtraceService& ktrace = platform::ktrace();
  const auto session = ktrace.ktrace_session_create();
  sessions_[&trace] = session;
  // The runner goes after the completion, or destroys the session before it goes.
  ktrace.ktrace_set_completion_handler(session,
                                       [this, &trace] { tracingCompletionHandler(trace); });
  ktrace.ktrace_set_walltimes_enabled(session, true);
}

void TraceRunner::startTracing(Trace& trace) {
  platform::KtraceService& ktrace = platform::ktrace();
  const auto& session = sessions_.at(&trace);
  TraceData::Events& events = events_.at(&trace);
  const int range = ktrace.ktrace_events_range(
      session, kFirstIdentifier, kLastIdentifier,
      [&events](const platform::trace_point& event) { events.push_back(event); });
  if (range != 0) kLog.error("Could not set up ktrace range, error: ", range);
  const int start = ktrace.ktrace_start(session, queue_);
  if (start != 0) kLog.error("Could not start ktrace session, error: ", start);
}

void TraceRunner::stopTracing(Trace& trace) {
  constexpr int kNoReason = 0;
  platform::ktrace().ktrace_end(sessions_.at(&trace), kNoReason);
}

void TraceRunner::tracingCompletionHandler(Trace& trace) {
  if (trace.isKernelTrace()) {
    trace.processTracepoints(sessions_.at(&trace), events_.at(&trace));
    tearDownTracing(trace);
  }
  completed_.fetch_add(1, std::memory_order_relaxed);
  completion_->signal();
}

void TraceRunner::tearDownTracing(Trace& trace) {
  platform::ktrace().ktrace_session_destroy(std::exchange(sessions_.at(&trace), nullptr));
}

void TraceRunner::stopTracingandProcessResults() {
  for (const auto& trace : traces_) {
    kLog.info("Tearing down trace :  ", trace->name());
    queue_->async(platform::JobWeight::kMayBlock, [this, &trace = *trace] {
      if (trace.isKernelTrace()) {
        stopTracing(trace);
      } else {
        tracingCompletionHandler(trace);
      }
    });
    completion_->wait();
    if (trace->isKernelTrace()) results_[trace.get()] = trace->getResults();
    kLog.info("Completed trace.... ", completed_.load(std::memory_order_relaxed), ",   ",
              traces_.size(), " ");
  }
  writeScoresheet();
}

void TraceRunner::printTraceResults(const Results::value_type& entry) {
  struct Summary {
    std::string_view name;
    std::uint32_t count;
    std::uint64_t minimum;
    std::uint64_t maximum;
  };
  std::vector<Summary> summaries;  // values of one name stand together
  for (const auto& [name, value] : entry.second) {
    if (summaries.empty() || summaries.back().name != name) {
      summaries.push_back({name, 0, value, value});
    }
    Summary& summary = summaries.back();
    ++summary.count;
    summary.minimum = std::min(summary.minimum, value);
    summary.maximum = std::max(summary.maximum, value);
  }
  for (const Summary& summary : summaries) {
    kLog.info("Writing out ", summary.count, " result for ", summary.name,
              ", min: ", summary.minimum, ", max: ", summary.maximum, " ");
  }
}

void TraceRunner::writeScoresheet() const {
  kLog.info("Completed trace....In write perf data.... ", results_.size());
  if (const auto error = platform::files().createDirectory(HVReportingTracingLogsDirectory,
                                                           kDirectoryPermissions)) {
    kLog.error("can't create logging directory at ", HVReportingTracingLogsDirectory, ": ",
               error->description);
  }
  const std::string path =
      std::string(HVReportingTracingLogsDirectory) + "/" + std::string(kResultsFileName);
  platform::ResultsFileService& resultsFiles = platform::resultsFiles();
  auto writer = resultsFiles.sswriter_open(path, kProductName, kResultsVersion, kNoFlags);
  if (writer == nullptr) {
    kLog.info("Failed to open scoresheet writer");
    platform::process().terminate(EXIT_FAILURE);
  }
  for (const auto& entry : results_) {
    printTraceResults(entry);
    for (const auto& [name, value] : entry.second) {
      resultsFiles.sswriter_new_value(*writer, name, platform::ssunit::ssunit_nanoseconds,
                                      static_cast<double>(value));
    }
  }
  resultsFiles.sswriter_close(std::move(writer));
}

}  // namespace halvox
