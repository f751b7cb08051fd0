#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "client/HalvoxClient.h"

struct sd_bus_message;

// Values on the wire: numbers as the integer, boolean or double that they are, strings, `(d)` for
// dates, `ay` for data, `av` for arrays, `a{sv}` for dictionaries. Reading also takes arrays of
// other types, and looks through variants.
namespace halvox::client {

// Appends a dictionary as one `a{sv}`. On failure says which key has no form on the wire and why;
// the message is then good for nothing.
[[nodiscard]] std::optional<std::string> appendDictionary(sd_bus_message* message,
                                                          const Dictionary& dictionary);

// Reads the next complete value of the message, whatever its type; none when it has no form here
// (file descriptors, other structs, keys that are not strings) or the message is at its end.
[[nodiscard]] std::optional<Value> readValue(sd_bus_message* message);

}  // namespace halvox::client
