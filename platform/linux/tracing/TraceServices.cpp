#include "platform/linux/tracing/TraceServices.h"

#include <system_error>
#include <utility>

#include "platform/linux/tracing/NoTraceServices.h"
#include "platform/linux/tracing/lttng/TracingEntryPoint.h"

namespace halvox::platform::linux_ {

std::unique_ptr<TraceServices> makeTraceServices(const TraceOptions& options, LogService& log,
                                                 StatisticsService& statistics) {
  const std::filesystem::path directory = options.storageDirectory / "traces";
  // Load the module also for leftovers, because a recording of an earlier run fills the disk until
  // its session is destroyed, and only the module can destroy it.
  if (options.tracing == Tracing::kDisabled && !hasTraceLeftovers(directory)) {
    return makeNoTraceServices("features.Acoustat.Tracing is not true");
  }
  auto loaded = loadEntryPoint<decltype(halvox_tracing_lttng_2)>(kTracingModule);
  if (!loaded) {
    return makeNoTraceServices("features.Acoustat.Tracing = true needs " + loaded.error().message);
  }
  return std::unique_ptr<TraceServices>((*loaded)(directory, log, statistics));
}

bool hasTraceLeftovers(const std::filesystem::path& tracesDirectory) {
  std::error_code ignored;
  return std::filesystem::exists(tracesDirectory / kTraceScratch, ignored) ||
         std::filesystem::exists(tracesDirectory / kTraceDaemonNote, ignored);
}

}  // namespace halvox::platform::linux_
