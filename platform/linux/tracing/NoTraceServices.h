#pragma once

#include <memory>
#include <string>

#include "platform/linux/tracing/TraceServices.h"

namespace halvox::platform::linux_ {

// Services whose traces cannot be started. `reason` is why, for the log.
[[nodiscard]] std::unique_ptr<TraceServices> makeNoTraceServices(const std::string& reason);

}  // namespace halvox::platform::linux_
