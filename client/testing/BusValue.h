#pragma once

#include <optional>

#include "client/HalvoxClient.h"

struct sd_bus_message;

// What sd-bus reads out of messages, as a check that shares no code with the library. Arrays of any
// type are read, and variants are unwrapped.
namespace halvox::client {

// Reads the next complete value of the message, of any type. Returns nothing at the end of the
// message and for types that values cannot hold: file descriptors, other structs, keys that are not
// strings.
[[nodiscard]] std::optional<Value> readValue(sd_bus_message* message);

}  // namespace halvox::client
