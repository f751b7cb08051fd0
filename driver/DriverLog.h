#pragma once

#include "backends/HVReportingVocabulary.h"
#include "platform/log.h"

namespace halvox {

// The log of all sources of the driver statistics. They share one unit name, because the name is
// part of the log lines' interface.
inline constexpr platform::UnitLog kDriverLog(&HVReportingDriverUtilityCategory,
                                              "HVReportingDriverUtility");

}  // namespace halvox
