#include "platform/linux/tracing/TraceServices.h"

#include <system_error>
#include <utility>
#include <variant>

#include "platform/linux/tracing/NoTraceServices.h"
#include "platform/linux/tracing/lttng/TracingEntryPoint.h"

namespace halvox::platform::linux_ {

std::unique_ptr<TraceServices> makeTraceServices(const TraceOptions& options,
                                                 StatisticsService& statistics) {
  const std::filesystem::path directory = options.storageDirectory / "traces";
  if (options.tracing == Tracing::kDisabled && !hasTraceLeftovers(directory)) {
    return makeNoTraceServices("features.Acoustat.Tracing is not true");
  }
  auto loaded = loadEntryPoint<decltype(halvox_tracing_lttng_1)>(kTracingModule);
  if (auto* why = std::get_if<std::string>(&loaded)) {
    return makeNoTraceServices("features.Acoustat.Tracing = true needs " + *why);
  }
  return std::unique_ptr<TraceServices>(
      std::get<decltype(&halvox_tracing_lttng_1)>(loaded)(directory, statistics));
}

bool hasTraceLeftovers(const std::filesystem::path& tracesDirectory) {
  std::error_code ignored;
  return std::filesystem::exists(tracesDirectory / kTraceScratch, ignored) ||
         std::filesystem::exists(tracesDirectory / kTraceDaemonNote, ignored);
}

}  // namespace halvox::platform::linux_
