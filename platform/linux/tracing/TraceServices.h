#pragma once

#include <filesystem>
#include <memory>
#include <string>

#include "platform/ktrace.h"
#include "platform/performance_trace.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// What records traces. Made before the other services are installed, opened when they are.
//
//   made --open()--> serving --stop()--> declining --close() or abandon()--> closed
class TraceServices {
 public:
  virtual ~TraceServices() = default;

  [[nodiscard]] virtual KtraceService& ktrace() = 0;
  [[nodiscard]] virtual PerformanceTraceService& performanceTraces() = 0;
  // Removes what a service before this one left behind with the same storage directory. May wait
  // for the tracer, but only when something was left.
  virtual void open() = 0;
  // What runs ends soon: nothing waits for queues any more. Before the queues end.
  virtual void stop() = 0;
  // Leaves nothing of ours in the tracer. After the queues have ended.
  virtual void close() = 0;
  // The same when a queue would not end, such as that of a stop that waits for its trace. May wait
  // for what is just being asked of the tracer.
  virtual void abandon() = 0;
  // In words, for the log.
  [[nodiscard]] virtual std::string description() const = 0;
};

// Traces by LTTng, recorded below the storage directory; without LTTng in this build services whose
// traces cannot be started. The statistics must outlive them.
[[nodiscard]] std::unique_ptr<TraceServices> makeTraceServices(
    const std::filesystem::path& storageDirectory, StatisticsService& statistics);

}  // namespace halvox::platform::linux_
