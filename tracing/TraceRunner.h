#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string_view>
#include <vector>

#include "platform/dispatch.h"
#include "tracing/Trace.h"
#include "tracing/TraceParams.h"

namespace halvox {

// The interface fixes this path. The platform puts its storage root in front of it.
inline constexpr std::string_view HVReportingTracingLogsDirectory =
    "/private/var/mobile/Library/Logs/Wreckbin/DiagnosticLogs/Audio/Traces";

// Records a kernel trace for each trace that it was given, and writes the measurements to a results
// file.
//
//   made --createTraceFromTraceParams--> made --runTraces--> recording
//        --stopTracingandProcessResults--> finished
//
// A runner records once: a call that does not suit its state does nothing. To trace the same
// parameters again, make another runner; the traces of this one keep their results, and a second
// recording would add to them.
//
// Owner: the session. If it destroys the runner during a recording, the runner's queue ends the
// recording and nothing is written.
// Threads: one caller at a time. Everything that waits for the tracer runs on the runner's own
// serial queue, where events and completions arrive too; the caller waits for that queue only in
// the stop.
// Failure: logged, and the rest continues. Only a results file that cannot be opened ends the
// process, with exit status 1; this hard end is required.
class TraceRunner {
 public:
  TraceRunner();
  TraceRunner(const TraceRunner&) = delete;
  TraceRunner& operator=(const TraceRunner&) = delete;
  virtual ~TraceRunner();

  // Adds a trace with an interval for each trace point, whatever the point's kind; an impulse never
  // yields a result, because its begin and end are equal. Null is logged and ignored.
  void createTraceFromTraceParams(const TraceParams* params);
  // Starts to record all kernel traces. Signposts are not started. Never blocks: the recording
  // begins, or its failure is logged, a little later.
  void runTraces();
  // Ends the traces strictly one after the other and writes the results file. Blocks until every
  // trace has completed, without a time limit; the interface demands that.
  void stopTracingandProcessResults();

  // True until runTraces().
  [[nodiscard]] bool canRun() const { return state_ == State::kMade; }
  [[nodiscard]] std::size_t getNumTraces() const { return recordings_.size(); }
  [[nodiscard]] static std::uint32_t getResultsVersion();

 private:
  struct Completions;
  class Recording;
  using Results = std::map<const Trace*, Trace::Results>;
  enum class State : std::uint8_t { kMade, kRecording, kFinished };

  // Logs one line for each name, with the number of its values and their range.
  static void printTraceResults(const Results::value_type& entry);
  // Writes the results of all traces to the results file and logs them. Waits for the disk.
  void writeScoresheet() const;

  State state_ = State::kMade;
  const std::shared_ptr<platform::DispatchQueue> queue_;
  const std::shared_ptr<platform::DispatchSemaphore> started_;  // one signal for each start
  const std::shared_ptr<Completions> completions_;              // shared with the recordings
  // Shared with the jobs of the queue, which may need them after the runner has been destroyed.
  std::vector<std::shared_ptr<Recording>> recordings_;
  Results results_;
};

}  // namespace halvox
