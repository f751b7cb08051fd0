#pragma once

#include "platform/log.h"

namespace halvox {

// The log category of everything about traces. The first call makes it; it lives as long as the
// process. Any thread may call.
platform::LogCategory& HVReportingTraceCategory();

}  // namespace halvox
