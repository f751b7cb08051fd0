#pragma once

#include <filesystem>
#include <memory>

#include "platform/linux/tracing/TraceServices.h"

namespace halvox::platform::linux_ {

// Traces by LTTng, recorded in that directory. The log and the statistics must outlive them.
[[nodiscard]] std::unique_ptr<TraceServices> makeLttngTraceServices(
    const std::filesystem::path& tracesDirectory, LogService& log, StatisticsService& statistics);

}  // namespace halvox::platform::linux_
