#pragma once

#include <optional>

#include "client/HalvoxClient.h"

struct sd_bus_message;

// Reads messages with sd-bus, which shares no code with the library. Reads arrays of any type, and
// unwraps variants.
namespace halvox::client {

// Reads the next complete value of the message. Returns std::nullopt at the end of the message, and
// for types that a Value cannot have: file descriptors, structs other than dates, and dictionaries
// with keys that are not strings.
[[nodiscard]] std::optional<Value> readValue(sd_bus_message* message);

}  // namespace halvox::client
