#include <algorithm>
#include <array>
#include <cstddef>
#include <utility>

#include "backends/HVReportingUtility.h"

namespace halvox {
namespace {

constexpr std::uint32_t kLowHalf = 0x0000FFFF;
constexpr std::uint32_t kHighHalf = 0xFFFF0000;
constexpr std::uint32_t kFirstWithHighHalf = 0x00010000;
// All bits set is the category of the summary event, which has no domain.
constexpr std::uint32_t kLastWithHighHalf = 0xFFFFFFFE;

// In these tables the position of a name is the number that clients send and that is stored.
constexpr std::array<std::string_view, 16> kCategoryNames = {
    "Undefined",         "Generic",     "Record", "Input",         "Playback",    "Output",
    "PlaybackAndRecord", "IO",          "Setup",  "ClientRequest", "RouteChange", "Error",
    "IOReporting",       "Performance", "Volume", "HearingHealth"};

constexpr std::array<std::string_view, 19> kTypeNames = {
    "Generic",
    "Start",
    "Stop",
    "Activate",
    "Deactivate",
    "Setup",
    "Error",
    "IssueDetector",
    "Joulebook",
    "AudioUnitUsage",
    "MIDIDriver",
    "Summary",
    "HeadphoneAudioExposure",
    "AudioExposure",
    "Listeningenhancement",  // the lower-case e is intended: event names contain it
    "Dorvan",
    "Simple",
    "Histogram",
    "State"};

constexpr std::array<std::string_view, 14> kServiceNames = {
    "generic",          "quillo",           "telephony",       "haptics",
    "alarms",           "standalone",       "soundautoconfig", "longformaudio",
    "nonlongformaudio", "audiodeviceusage", "alerts",          "test",
    "apiusage",         "systemsounds"};
constexpr std::string_view kUnknownServiceName = "unknown";

bool hasHighHalf(AudioEventCategory category) {
  const auto value = static_cast<std::uint32_t>(category);
  return value >= kFirstWithHighHalf && value <= kLastWithHighHalf;
}

// Returns the text of a domain followed by "_", or "_" alone for bits that are not exactly one
// domain.
std::string_view domainText(AudioEventCategory domain) {
  switch (domain) {
    case AudioEventCategory::kMIDI:
      return "MIDI_";
    case AudioEventCategory::kSession:
      return "Session_";
    case AudioEventCategory::kDSP:
      return "DSP_";
    case AudioEventCategory::kHAL:
      return "HAL_";
    case AudioEventCategory::kRouting:
      return "Routing_";
    case AudioEventCategory::kToolbox:
      return "Toolbox_";
    default:  // reached: clients may set any bits
      return "_";
  }
}

}  // namespace

HVReportingCategoryText HVReportingUtilityCategoryTextParts(AudioEventCategory category) {
  const auto value = static_cast<std::uint32_t>(category);
  const std::uint32_t low = value & kLowHalf;
  // The "_" of a category whose high half is not exactly one domain is required. It shows that the
  // high half was not empty.
  return {hasHighHalf(category) ? domainText(static_cast<AudioEventCategory>(value & kHighHalf))
                                : std::string_view{},
          kCategoryNames[low < kCategoryNames.size() ? low : 0]};
}

std::string HVReportingUtilityCategoryString(AudioEventCategory category) {
  const HVReportingCategoryText parts = HVReportingUtilityCategoryTextParts(category);
  std::string text;
  text.reserve(parts.domain.size() + parts.name.size());
  text += parts.domain;
  text += parts.name;
  return text;
}

std::string_view HVReportingUtilityTypeString(AudioEventType type) {
  return HVReportingUtilityTypeString(std::uint32_t{static_cast<std::uint16_t>(type)});
}

std::string_view HVReportingUtilityTypeString(std::uint32_t type) {
  if (type < kTypeNames.size()) return kTypeNames[type];
  const bool unknown = type == static_cast<std::uint32_t>(AudioEventType::kUnknown);
  return unknown ? "Unknown" : kTypeNames[0];
}

std::string_view HVReportingUtilityGenerateServiceNameFromServiceType(
    AudioServiceType serviceType) {
  if (serviceType == AudioServiceType::kUnknown) return kUnknownServiceName;
  const auto value = static_cast<std::size_t>(serviceType);
  if (value < kServiceNames.size()) return kServiceNames[value];
  // Unlisted values are deliberately telephony, not unknown.
  return kServiceNames[static_cast<std::size_t>(AudioServiceType::kTelephony)];
}

AudioServiceType HVReportingUtilityGenerateServiceTypeFromServiceName(
    std::optional<std::string_view> serviceName) {
  if (!serviceName.has_value()) return AudioServiceType::kUnknown;
  const auto* const found = std::ranges::find(kServiceNames, *serviceName);
  if (found == kServiceNames.end()) return AudioServiceType::kUnknown;  // includes "unknown" itself
  return static_cast<AudioServiceType>(found - kServiceNames.begin());
}

bool HVReportingUtilityShouldSendMessage() { return true; }

bool HVReportingUtilityAllowSessionTransactions() { return true; }

bool HVReportingUtilityShouldBatchTLMReportingEventsForServiceType(AudioServiceType serviceType) {
  return serviceType != AudioServiceType::kAPIUsage;
}

bool HVReportingUtilityIsABTestModeOn(AudioEventCategory category) { return hasHighHalf(category); }

std::uint16_t HVReportingUtilityRetrieveTLMReportingCategoryFromCategory(
    AudioEventCategory category) {
  return static_cast<std::uint16_t>(static_cast<std::uint32_t>(category) & kLowHalf);
}

std::int64_t HVReportingUtilityExtractSessionIDFromReporterID(ReporterID reporterID) {
  return static_cast<std::int64_t>(reporterID);
}

double HVReportingUtilityVolumeMinimumPlayingTime(AudioServiceType /*serviceType*/) {
  constexpr double kSeconds = 0.5;  // for every service
  return kSeconds;
}

}  // namespace halvox
