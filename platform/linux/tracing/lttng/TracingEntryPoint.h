#pragma once

#include <filesystem>

#include "platform/linux/modules/Module.h"
#include "platform/linux/tracing/TraceServices.h"

namespace halvox::platform::linux_ {

inline constexpr Module kTracingModule{"halvox-tracing-lttng.so", "halvox_tracing_lttng_2"};

// Makes the services, which the caller owns.
extern "C" TraceServices* halvox_tracing_lttng_2(const std::filesystem::path& tracesDirectory,
                                                 LogService& log, StatisticsService& statistics);

}  // namespace halvox::platform::linux_
