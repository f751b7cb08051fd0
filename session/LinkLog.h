#pragma once

#include "backends/HVReportingVocabulary.h"
#include "platform/log.h"

namespace halvox {

// What the session logs with about its real-time link. Messages on their way through the link are
// the session's own affair and go to its other log.
inline constexpr platform::UnitLog kLinkLog(&HVReportingSessionTLMReportingCategory,
                                            "HVReportingSession");

}  // namespace halvox
