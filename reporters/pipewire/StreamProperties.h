#pragma once

#include <functional>
#include <map>
#include <string>
#include <string_view>

#include "platform/value.h"
#include "reporters/pipewire/ReportingClient.h"

namespace halvox::pipewire_reporter {

// The properties of a PipeWire object, as they came: any text under any key.
using Properties = std::map<std::string, std::string, std::less<>>;

enum class Direction : std::uint8_t { kPlayback, kRecord };

// The text under a key; empty when there is none.
std::string_view property(const Properties& properties, std::string_view key);

// The service type that stands for a media role, whatever its letters' case.
// No role is generic; a role that is not known is treated as short sound.
ServiceType serviceTypeForRole(std::string_view role);

// What a session tells about its stream, under the service's keys. Properties that are missing,
// empty or, where a number is due, not a number are left out; texts are cleaned.
platform::Dictionary makeConfiguration(const Properties& properties);

// The name of the process behind a stream, or the next best name that its properties have.
std::string processName(const Properties& properties);

}  // namespace halvox::pipewire_reporter
