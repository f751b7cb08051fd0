#pragma once

#include "backends/HVReportingVocabulary.h"
#include "platform/log.h"

namespace halvox {

// The log of the link's own events. Lines about the messages that it sends go to the session's log.
inline constexpr platform::UnitLog kLinkLog(&HVReportingSessionTLMReportingCategory,
                                            "HVReportingSession");

}  // namespace halvox
