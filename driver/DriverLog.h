#pragma once

#include "backends/HVReportingVocabulary.h"
#include "platform/log.h"

namespace halvox {

// What the sources of the driver statistics log with.
inline constexpr platform::UnitLog kDriverLog(&HVReportingDriverUtilityCategory,
                                              "HVReportingDriverUtility");

}  // namespace halvox
