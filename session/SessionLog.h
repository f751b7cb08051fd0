#pragma once

#include <cstdint>

#include "backends/HVReportingVocabulary.h"
#include "platform/log.h"

namespace halvox {

// The log of this folder's sources. All of them log under the name of the session's class, which
// tools match.
inline constexpr platform::UnitLog kSessionLog(&HVReportingSessionCategory, "HVReportingSession");

// Values of the vocabulary as log lines show them.
constexpr std::int64_t number(ReporterID reporterID) {
  return static_cast<std::int64_t>(reporterID);
}
constexpr std::uint16_t number(AudioServiceType serviceType) {
  return static_cast<std::uint16_t>(serviceType);
}
// A signed number, because tools expect categories in this form.
constexpr std::int32_t number(AudioEventCategory category) {
  return static_cast<std::int32_t>(category);
}
constexpr std::uint16_t number(AudioEventType type) { return static_cast<std::uint16_t>(type); }

}  // namespace halvox
