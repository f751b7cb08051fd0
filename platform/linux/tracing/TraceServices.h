#pragma once

#include <cstdint>
#include <filesystem>
#include <memory>
#include <string>

#include "platform/ktrace.h"
#include "platform/log.h"
#include "platform/performance_trace.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// The services that record traces. The platform owns them: it makes them before the services are
// installed and opens them afterwards.
//
//   made --open()--> serving --stop()--> declining --close() or abandon()--> closed
//
// The steps are separate because the service ends in steps. stop() makes running traces end soon,
// so that queues which wait for a trace can end. close() cleans the tracer up when no queue can
// start another trace. The functions below run on the main thread and log failures.
class TraceServices {
 public:
  virtual ~TraceServices() = default;

  [[nodiscard]] virtual KtraceService& ktrace() = 0;
  [[nodiscard]] virtual PerformanceTraceService& performanceTraces() = 0;
  // Removes what an earlier service with the same storage directory did not remove. Waits for the
  // tracer only if something remains.
  virtual void open() = 0;
  // Lets running traces end soon. After this call, nothing waits for a queue. Call it before the
  // queues end.
  virtual void stop() = 0;
  // Removes everything that this service made in the tracer. Call it after the queues have ended.
  virtual void close() = 0;
  // Call this instead of close() if a queue does not end, for example because a stop waits for its
  // trace. May wait for an operation of the tracer that is in progress.
  virtual void abandon() = 0;
  // Names the tracer in log lines.
  [[nodiscard]] virtual std::string description() const = 0;
};

enum class Tracing : std::uint8_t { kDisabled, kEnabled };

struct TraceOptions {
  std::filesystem::path storageDirectory;  // of the service; traces are below it
  Tracing tracing = Tracing::kDisabled;    // whether a session may be traced at all
};

// Returns services that record with LTTng. Loads halvox-tracing-lttng.so for them, and with it
// LTTng's control library and babeltrace2. Returns services whose traces cannot be started, and
// whose description says why, when tracing is disabled or the module cannot be loaded. The module
// is also loaded when an earlier service did not remove a recording, because only the module can
// remove it. The log and the statistics must outlive the services.
[[nodiscard]] std::unique_ptr<TraceServices> makeTraceServices(const TraceOptions& options,
                                                               LogService& log,
                                                               StatisticsService& statistics);

// True if a service that ended in the middle of a trace left something in that directory.
[[nodiscard]] bool hasTraceLeftovers(const std::filesystem::path& tracesDirectory);

// Names in the directory of traces: the directory of the traces being recorded, and the file that
// names the tracer's daemon.
inline constexpr const char* kTraceScratch = "scratch";
inline constexpr const char* kTraceDaemonNote = "lttng-sessiond";

}  // namespace halvox::platform::linux_
