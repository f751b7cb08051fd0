#include "platform/linux/tracing/lttng/TracingEntryPoint.h"

#include "platform/linux/tracing/lttng/LttngTraceServices.h"

namespace halvox::platform::linux_ {

TraceServices* halvox_tracing_lttng_2(const std::filesystem::path& tracesDirectory, LogService& log,
                                      StatisticsService& statistics) {
  return makeLttngTraceServices(tracesDirectory, log, statistics).release();
}

}  // namespace halvox::platform::linux_
