#include "platform/linux/tracing/lttng/TracingEntryPoint.h"

#include "platform/linux/tracing/lttng/LttngTraceServices.h"

namespace halvox::platform::linux_ {

TraceServices* halvox_tracing_lttng_1(const std::filesystem::path& tracesDirectory,
                                      StatisticsService& statistics) {
  return makeLttngTraceServices(tracesDirectory, statistics).release();
}

}  // namespace halvox::platform::linux_
