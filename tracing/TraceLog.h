#pragma once

#include "platform/log.h"

namespace halvox {

// The log category of everything about traces, made on first use and kept for the life of the
// process. Any thread may ask.
platform::LogCategory& HVReportingTraceCategory();

}  // namespace halvox
