#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "client/HalvoxClient.h"

struct sd_bus_message;

// Values on the wire. Numbers keep their type: integer, boolean or double. Dates are `(d)`, data is
// `ay`, arrays are `av`, dictionaries are `a{sv}`. Reading also accepts arrays of other types, and
// unwraps variants.
namespace halvox::client {

// Appends a dictionary as one `a{sv}`. On failure returns the key that the wire cannot hold and the
// reason; the message must not be used any more then.
[[nodiscard]] std::optional<std::string> appendDictionary(sd_bus_message* message,
                                                          const Dictionary& dictionary);

// Reads the next complete value of the message, of any type. Returns nothing at the end of the
// message and for types that values cannot hold: file descriptors, other structs, keys that are not
// strings.
[[nodiscard]] std::optional<Value> readValue(sd_bus_message* message);

}  // namespace halvox::client
