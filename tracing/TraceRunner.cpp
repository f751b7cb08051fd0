#include "tracing/TraceRunner.h"

#include <algorithm>
#include <atomic>
#include <cstdlib>
#include <string>
#include <utility>

#include "platform/files.h"
#include "platform/ktrace.h"
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
// The readers of these files expect these permissions. Other users are kept out by the permissions
// of the storage root.
constexpr std::uint32_t kDirectoryPermissions = 0777;
constexpr std::string_view kQueueLabel = "Tracing Queue";
// The range of identifiers that is recorded: what the audio frameworks emit.
constexpr std::uint32_t kFirstIdentifier = 0x21040000;
constexpr std::uint32_t kLastIdentifier = 0x2104408A;
// Room for a usual trace; a longer one grows the vector.
constexpr std::size_t kExpectedEvents = 10'000;

}  // namespace

// How many traces have completed, and a signal for each. Shared by the runner and its recordings,
// because a recording may complete after the runner has been destroyed.
struct TraceRunner::Completions {
  std::atomic<std::uint32_t> count{0};  // relaxed: read after the signal, which orders it
  const std::shared_ptr<platform::DispatchSemaphore> signals =
      platform::dispatch().createSemaphore(0);
};

// The recording of one trace.
//
// Belongs to the runner until it starts, then to the runner's queue until it has completed. A
// recording that was set up must be torn down, by its completion or by the runner's destructor. Its
// handlers hold `this`, and only the tear-down guarantees that none is called any more.
class TraceRunner::Recording {
 public:
  Recording(std::string name, Trace::Kind kind, std::shared_ptr<Completions> completions)
      : trace_(std::move(name), kind), completions_(std::move(completions)) {
    events_.reserve(kExpectedEvents);
  }

  [[nodiscard]] Trace& trace() { return trace_; }

  void setupTracing() {
    platform::KtraceService& ktrace = platform::ktrace();
    session_ = ktrace.ktrace_session_create();
    ktrace.ktrace_set_completion_handler(session_, [this] { tracingCompletionHandler(); });
    ktrace.ktrace_set_walltimes_enabled(session_, true);
  }
  void subscribe() {
    const int range = platform::ktrace().ktrace_events_range(
        session_, kFirstIdentifier, kLastIdentifier,
        [this](const platform::trace_point& event) { events_.push_back(event); });
    // This error is not fatal: the recording starts anyway and records nothing. This is required.
    if (range != 0) kLog.error("Could not set up ktrace range, error: ", range);
  }
  void startTracing(const std::shared_ptr<platform::DispatchQueue>& queue) {
    const int start = platform::ktrace().ktrace_start(session_, queue);
    if (start != 0) kLog.error("Could not start ktrace session, error: ", start);
  }
  void stopTracing() {
    constexpr int kNoReason = 0;
    platform::ktrace().ktrace_end(session_, kNoReason);
  }
  void tracingCompletionHandler() {
    if (trace_.isKernelTrace()) {
      trace_.processTracepoints(session_, events_);
      tearDownTracing();
    }
    completions_->count.fetch_add(1, std::memory_order_relaxed);
    completions_->signals->signal();
  }
  void tearDownTracing() {
    platform::ktrace().ktrace_session_destroy(std::exchange(session_, nullptr));
  }

 private:
  Trace trace_;
  const std::shared_ptr<Completions> completions_;
  platform::KtraceService::Session session_;  // null before the set-up and after the tear-down
  TraceData::Events events_;
};

TraceRunner::TraceRunner()
    : queue_(platform::dispatch().createSerialQueue(
          // The quality is not lower, because a stop waits for this queue on the reporting queue.
          kQueueLabel, platform::QualityOfService::kUserInteractive,
          platform::QueueThreading::kOwnThread)),
      started_(platform::dispatch().createSemaphore(0)),
      completions_(std::make_shared<Completions>()) {}

// A runner can be destroyed while it records. This happens if its session was replaced by one with
// the same ID without a stop, or was no longer a test session when it stopped. The queue ends the
// recordings, after starts that still wait for the tracer. The destructor itself does not wait,
// because it runs on the reporting queue.
TraceRunner::~TraceRunner() {
  if (state_ != State::kRecording) return;
  for (const auto& recording : recordings_) {
    queue_->async(platform::JobWeight::kMayBlock, [recording] { recording->tearDownTracing(); });
  }
}

std::uint32_t TraceRunner::getResultsVersion() { return kResultsVersion; }

void TraceRunner::createTraceFromTraceParams(const TraceParams* params) {
  if (params == nullptr) {
    kLog.notice("Attempted to add nullptr to trace runner");
    return;
  }
  if (state_ != State::kMade) return;
  auto recording = std::make_shared<Recording>(
      params->name,
      params->type == TraceType::kKernelTrace ? Trace::Kind::kKernelTrace : Trace::Kind::kSignpost,
      completions_);
  for (const TraceDataParams& point : params->tracePoints) {
    // An interval whatever the kind; this is required. For an impulse it finds nothing, because
    // begin and end are equal.
    recording->trace().addTraceDataToCollect(std::make_unique<TraceInterval>(
        point.name,
        TraceIntervalCodes{
            .begin = point.beginCode, .end = point.endCode, .matchByThread = point.matchByThread}));
  }
  recordings_.push_back(std::move(recording));
}

void TraceRunner::runTraces() {
  // A second recording would add to the results of the first.
  if (state_ != State::kMade) return;
  state_ = State::kRecording;
  kLog.info("Number of traces to perform: ", recordings_.size());
  for (const auto& recording : recordings_) {
    const Trace& trace = recording->trace();
    kLog.info("Performing trace : ", trace.name());
    if (!trace.isKernelTrace()) continue;
    kLog.info("Setting up tracing: ", trace.name());
    recording->setupTracing();
    kLog.info("Starting tracing: ", trace.name());
    // The recording is subscribed before it starts, because a start begins to deliver events at
    // once.
    recording->subscribe();
    // Started on the queue, because the tracer may take seconds to start and every client waits for
    // the thread that starts sessions.
    queue_->async(platform::JobWeight::kMayBlock, [recording, queue = queue_, started = started_] {
      recording->startTracing(queue);
      started->signal();
    });
  }
}

void TraceRunner::stopTracingandProcessResults() {
  if (state_ != State::kRecording) return;
  state_ = State::kFinished;
  // Waits for every start: an error of a start must be logged before the lines of the stop.
  for (const auto& recording : recordings_) {
    if (recording->trace().isKernelTrace()) started_->wait();
  }
  for (const auto& recording : recordings_) {
    Trace& trace = recording->trace();
    kLog.info("Tearing down trace :  ", trace.name());
    queue_->async(platform::JobWeight::kMayBlock, [recording] {
      if (recording->trace().isKernelTrace()) {
        recording->stopTracing();
      } else {
        recording->tracingCompletionHandler();
      }
    });
    // Traces are ended one at a time: the next one only after this one has completed. This is
    // required.
    completions_->signals->wait();
    if (trace.isKernelTrace()) results_[&trace] = trace.getResults();
    kLog.info("Completed trace.... ", completions_->count.load(std::memory_order_relaxed), ",   ",
              recordings_.size(), " ");
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
  std::vector<Summary> summaries;  // a multimap keeps the values of one name together
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
    // This error is not fatal by itself: if the directory is really missing, opening the file fails
    // next.
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
