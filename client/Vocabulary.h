#pragma once

#include <array>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include "client/HalvoxClient.h"

// The numbers of categories, event types and service types, and their names.
namespace halvox::client {

struct NamedNumber {
  std::string_view name;
  std::uint32_t number = 0;
};

// What a message is about. The low 16 bits of a Category are one of these numbers. Its high 16 bits
// may have one domain.
enum class CategoryProper : std::uint16_t {
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
};

// The part of the audio system that a message comes from.
enum class Domain : std::uint32_t {
  kNone = 0,
  kMIDI = 0x04000000,
  kSession = 0x08000000,
  kDSP = 0x10000000,
  kHAL = 0x20000000,
  kRouting = 0x40000000,
  kToolbox = 0x80000000,
};

// What happened.
enum class Event : EventType {
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
  kListeningenhancement = 14,
  kDorvan = 15,
  kSimple = 16,
  kHistogram = 17,
  kState = 18,
  kUnknown = 65535,
};

// What kind of audio a session is for.
enum class Service : ServiceType {
  kGeneric = 0,
  kQuillo = 1,
  kTelephony = 2,
  kHaptics = 3,
  kAlarms = 4,
  kStandalone = 5,
  kSoundautoconfig = 6,
  kLongformaudio = 7,
  kNonlongformaudio = 8,
  kAudiodeviceusage = 9,
  kAlerts = 10,
  kTest = 11,
  kApiusage = 12,
  kSystemsounds = 13,
  kUnknown = 65535,
};

constexpr Category makeCategory(CategoryProper category, Domain domain = Domain::kNone) {
  return static_cast<Category>(domain) | static_cast<Category>(category);
}

// All names with their numbers, in the order of the numbers.
std::span<const NamedNumber> domains();
std::span<const NamedNumber> categories();
std::span<const NamedNumber> eventTypes();
std::span<const NamedNumber> serviceTypes();

// These functions return the name of a number in the service's spelling, such as
// "Session_Playback", "Start" or "telephony". If a number has no name, a category is "Undefined",
// with its domain as a prefix if it has one, an event type is "Generic", and a service type is
// "telephony".
std::string categoryName(Category category);
std::string_view eventTypeName(EventType type);
std::string_view serviceTypeName(ServiceType type);

// These functions return the number of a name, ignoring case; std::nullopt for an unknown name.
std::optional<Category> findCategory(std::string_view name);
std::optional<EventType> findEventType(std::string_view name);
std::optional<ServiceType> findServiceType(std::string_view name);

}  // namespace halvox::client
