#pragma once

#include <cstdint>

#include "backends/HVReportingVocabulary.h"
#include "platform/log.h"

namespace halvox {

// What the sources of the session log with.
inline constexpr platform::UnitLog kSessionLog(&HVReportingSessionCategory, "HVReportingSession");

// The vocabulary's values as log lines show them.
constexpr std::int64_t number(ReporterID reporterID) {
  return static_cast<std::int64_t>(reporterID);
}
constexpr std::uint16_t number(AudioServiceType serviceType) {
  return static_cast<std::uint16_t>(serviceType);
}

}  // namespace halvox
