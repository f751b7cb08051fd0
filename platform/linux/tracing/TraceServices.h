#pragma once

#include <filesystem>
#include <memory>
#include <string>

#include "platform/ktrace.h"
#include "platform/performance_trace.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// The services that record traces. The platform owns them: it makes them before the services are
// installed and opens them afterwards.
//
//   made --open()--> serving --stop()--> declining --close() or abandon()--> closed
//
// The steps are separate because the service ends in steps. stop() makes running traces end soon,
// so that queues which wait for a trace can end; close() cleans the tracer up when no queue can
// start a trace any more. The functions below run on the main thread and log what fails.
class TraceServices {
 public:
  virtual ~TraceServices() = default;

  [[nodiscard]] virtual KtraceService& ktrace() = 0;
  [[nodiscard]] virtual PerformanceTraceService& performanceTraces() = 0;
  // Removes what an earlier service left behind for the same storage directory. Waits for the
  // tracer only if something was left.
  virtual void open() = 0;
  // Lets running traces end soon: from now on nothing waits for a queue. Call it before the queues
  // end.
  virtual void stop() = 0;
  // Removes everything of ours from the tracer. Call it after the queues have ended.
  virtual void close() = 0;
  // The same if a queue does not end, such as that of a stop that waits for its trace. May wait for
  // an operation of the tracer that is in progress.
  virtual void abandon() = 0;
  // Names the tracer in log lines.
  [[nodiscard]] virtual std::string description() const = 0;
};

// Services that record with LTTng below the storage directory. In a build without LTTng, services
// whose traces cannot be started. The statistics must outlive them.
[[nodiscard]] std::unique_ptr<TraceServices> makeTraceServices(
    const std::filesystem::path& storageDirectory, StatisticsService& statistics);

}  // namespace halvox::platform::linux_
