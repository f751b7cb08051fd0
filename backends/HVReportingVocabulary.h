#pragma once

#include <cstdint>
#include <string_view>

namespace halvox::platform {
class LogCategory;
}

namespace halvox {

// The identifier that a client chose for its session. A type of its own, so that no other number
// can be passed for it.
enum class ReporterID : std::int64_t {};
// Identifies no session.
inline constexpr ReporterID kNoReporterID{0};

// What a message is about. The low 16 bits are the category itself. `|` may add one domain in the
// high 16 bits. Clients may send any value, including unlisted ones.
enum class AudioEventCategory : std::uint32_t {
  kUndefined = 0,
  kGeneric = 1,
  kRecord = 2,
  kInput = 3,
  kPlayback = 4,
  kOutput = 5,
  kPlaybackAndRecord = 6,
  kIO = 7,
  kSetup = 8,
  kClientRequest = 9,
  kRouteChange = 10,
  kError = 11,
  kIOReporting = 12,
  kPerformance = 13,
  kVolume = 14,
  kHearingHealth = 15,
  // Domains.
  kMIDI = 0x04000000,
  kSession = 0x08000000,
  kDSP = 0x10000000,
  kHAL = 0x20000000,
  kRouting = 0x40000000,
  kToolbox = 0x80000000,
};

constexpr AudioEventCategory operator|(AudioEventCategory left, AudioEventCategory right) {
  return static_cast<AudioEventCategory>(static_cast<std::uint32_t>(left) |
                                         static_cast<std::uint32_t>(right));
}

// What happened. Clients may send any value, including unlisted ones.
enum class AudioEventType : std::uint16_t {
  kStart = 1,
  kStop = 2,
  kActivate = 3,
  kDeactivate = 4,
  kSetup = 5,
  kError = 6,
  kIssueDetector = 7,
  kJoulebook = 8,
  kAudioUnitUsage = 9,
  kMIDIDriver = 10,
  kSummary = 11,
  kHeadphoneAudioExposure = 12,
  kAudioExposure = 13,
  kListeningEnhancement = 14,
  kDorvan = 15,
  kSimple = 16,
  kHistogram = 17,
  kState = 18,
  kUnknown = 65535,
};

// The kind of audio of a session. Clients may send any value, including unlisted ones.
enum class AudioServiceType : std::uint16_t {
  kGeneric = 0,
  kQuillo = 1,
  kTelephony = 2,
  kHaptics = 3,
  kAlarms = 4,
  kStandalone = 5,
  kSoundAutoConfig = 6,
  kLongFormAudio = 7,
  kNonLongFormAudio = 8,
  kAudioDeviceUsage = 9,
  kAlerts = 10,
  kTest = 11,
  kAPIUsage = 12,
  kSystemSounds = 13,
  kUnknown = 65535,
};

// The subsystem under which all components log.
inline constexpr std::string_view kHVReportingLogSubsystem = "com.tarno.halvox";

// The log categories of the components. Each is created on first use and lives as long as the
// process. Any thread may call. Nothing logs to HVReportingClientCategory; it is nevertheless
// required.
platform::LogCategory& HVReportingClientCategory();
platform::LogCategory& HVReportingServiceDelegateCategory();
platform::LogCategory& HVReportingSessionCategory();
platform::LogCategory& HVReportingSessionTLMReportingCategory();
platform::LogCategory& HVReportingDriverUtilityCategory();
platform::LogCategory& HVReportingJoulebookCategory();
platform::LogCategory& HVReportingZUBLogCategory();
platform::LogCategory& HVReportingVEKLogCategory();

}  // namespace halvox
