#pragma once

#include <functional>
#include <map>
#include <string>
#include <string_view>

#include "platform/value.h"
#include "reporters/pipewire/ReportingClient.h"

namespace halvox::pipewire_reporter {

// The properties of a PipeWire object as they were received: any text under any key.
using Properties = std::map<std::string, std::string, std::less<>>;

// Whether a stream plays or records.
enum class Direction : std::uint8_t { kPlayback, kRecord };

// Returns the text under a key; empty when there is none.
std::string_view property(const Properties& properties, std::string_view key);

// Returns the service type for a media role, ignoring case. An empty role is generic; an unknown
// role counts as short sounds.
ServiceType serviceTypeForRole(std::string_view role);

// Makes the configuration of a stream's session. Omits properties that are missing or empty, and
// numbers that do not parse. Texts are cleaned (see cleanText).
platform::Dictionary makeConfiguration(const Properties& properties);

// Returns the name of a node, or one made from its serial if it has none. Never empty.
std::string nodeName(const Properties& properties, std::uint64_t serial);

// Returns the name of a stream's process: its binary, else the name of the application, else the
// name of the node, else "Unknown".
std::string processName(const Properties& properties);

}  // namespace halvox::pipewire_reporter
