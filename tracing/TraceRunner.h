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

inline constexpr std::string_view HVReportingTracingLogsDirectory =
    "/private/var/mobile/Library/Logs/Wreckbin/DiagnosticLogs/Audio/Traces";

// Records a kernel trace for each trace that it was given, and writes what was measured to a
// results file.
//
//   made --createTraceFromTraceParams--> made --runTraces--> recording
//        --stopTracingandProcessResults--> finished
//
// A runner records once: what does not suit its state does nothing, so a finished runner cannot be
// stopped again and one that never ran has nothing to stop. Traces of the same parameters are
// recorded again by another runner.
//
// The caller is one thread at a time. What waits for the tracer is done by the runner's own serial
// queue, where events and completions come too; the caller waits for it only when it stops. Owned
// by its session; when it goes while it records, its queue ends the recordings and nothing is
// written. Failures are logged and the rest goes on; only a results file that cannot be opened ends
// the process, with exit status 1, and that is intended.
class TraceRunner {
 public:
  TraceRunner();
  TraceRunner(const TraceRunner&) = delete;
  TraceRunner& operator=(const TraceRunner&) = delete;
  virtual ~TraceRunner();

  // Adds a trace with an interval for each trace point, whatever its kind. Null is logged.
  void createTraceFromTraceParams(const TraceParams* params);
  // Starts to record all kernel traces; signposts are not started. Never blocks: the recording
  // begins, or its failure is logged, a little later.
  void runTraces();
  // Ends the traces, one strictly after the other, and writes the results file. Blocks until every
  // trace has completed, without a time limit.
  void stopTracingandProcessResults();

  // Whether it has not run yet.
  [[nodiscard]] bool canRun() const { return state_ == State::kMade; }
  [[nodiscard]] std::size_t getNumTraces() const { return recordings_.size(); }
  [[nodiscard]] static std::uint32_t getResultsVersion();

 private:
  struct Completions;
  class Recording;
  using Results = std::map<const Trace*, Trace::Results>;
  enum class State : std::uint8_t { kMade, kRecording, kFinished };

  static void printTraceResults(const Results::value_type& entry);
  void writeScoresheet() const;

  State state_ = State::kMade;
  const std::shared_ptr<platform::DispatchQueue> queue_;
  const std::shared_ptr<platform::DispatchSemaphore> started_;  // signalled after each start
  const std::shared_ptr<Completions> completions_;              // shared with the recordings
  // Shared with the jobs of the queue, which may still need them when the runner has gone.
  std::vector<std::shared_ptr<Recording>> recordings_;
  Results results_;
};

}  // namespace halvox
