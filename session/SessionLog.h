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
// Signed, as categories have always been logged.
constexpr std::int32_t number(AudioEventCategory category) {
  return static_cast<std::int32_t>(category);
}
constexpr std::uint16_t number(AudioEventType type) { return static_cast<std::uint16_t>(type); }

}  // namespace halvox
