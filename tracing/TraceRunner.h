#pragma once

#include <atomic>
#include <cstdint>
#include <map>
#include <memory>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/dispatch.h"
#include "platform/ktrace.h"
#include "tracing/Trace.h"
#include "tracing/TraceParams.h"

namespace halvox {

inline constexpr std::string_view HVReportingTracingLogsDirectory =
    "/private/var/mobile/Library/Logs/Wreckbin/DiagnosticLogs/Audio/Traces";

// Records a kernel trace for each trace that it was given, and writes what was measured to a
// results file.
//
//   made --createTraceFromTraceParams--> with traces --runTraces--> recording
//        --stopTracingandProcessResults--> results written; not used again
//
// The caller is one thread at a time. Events and completions come on the runner's own serial queue,
// and the caller waits for them at the end, so what they write is read only after it is complete.
// Owned by its session; when it goes unstopped, its recordings end and nothing is written. Failures
// are logged and the rest goes on; only a results file that cannot be opened ends the process, with
// exit status 1, and that is intended.
class TraceRunner {
 public:
  TraceRunner();
  TraceRunner(const TraceRunner&) = delete;
  TraceRunner& operator=(const TraceRunner&) = delete;
  virtual ~TraceRunner();

  // Adds a trace with an interval for each trace point, whatever its kind. Null is logged.
  void createTraceFromTraceParams(const TraceParams* params);
  // Starts to record all kernel traces; signposts are not started.
  void runTraces();
  // Ends the traces, one strictly after the other, and writes the results file. Blocks until every
  // trace has completed, without a time limit.
  void stopTracingandProcessResults();

  [[nodiscard]] std::size_t getNumTraces() const { return traces_.size(); }
  [[nodiscard]] static std::uint32_t getResultsVersion();

 private:
  using Results = std::map<const Trace*, Trace::Results>;

  void setupTracing(Trace& trace);
  void startTracing(Trace& trace);
  void stopTracing(Trace& trace);
  void tracingCompletionHandler(Trace& trace);
  void tearDownTracing(Trace& trace);
  static void printTraceResults(const Results::value_type& entry);
  void writeScoresheet() const;

  std::vector<std::unique_ptr<Trace>> traces_;
  std::atomic<std::uint32_t> completed_{0};  // read after the semaphore, which orders it
  std::shared_ptr<platform::DispatchQueue> queue_;
  std::shared_ptr<platform::DispatchSemaphore> completion_;
  std::map<const Trace*, platform::KtraceService::Session> sessions_;  // null: torn down
  std::map<const Trace*, TraceData::Events> events_;
  Results results_;
};

}  // namespace halvox
