#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/connection/wire/Frame.h"
#include "platform/value.h"

namespace halvox::platform::linux_::dbus {

// Why the body of a message was not taken.
struct DecodeError {
  enum class Kind : std::uint8_t {
    kMalformed,       // the bytes break the rules of the wire: the connection cannot go on
    kUnsupported,     // a sound message with a value that we have no form for
    kWrongSignature,  // a sound message whose arguments are not the ones asked for
  };
  Kind kind = Kind::kMalformed;
  // Where it happened: the number of the argument, counted from 1, and the path of dictionary keys
  // and element numbers (from 0) inside it, as in `argument 1, key "a"."b"[3]`. Long keys are cut.
  // Empty for a wrong signature.
  std::string key;
  // The signature of the value there; empty when it is not known. May be cut when malformed.
  std::string signature;
  // One line of valid UTF-8 that names both; fit for the log and for the answer to the client.
  std::string message;
};

// Decodes the body of a frame, whose arguments must have exactly the expected signature, into
// `arguments` (whatever was in there is dropped; empty after an error).
//
//   y n q i u x t, d, b  numbers of that kind (NaN and infinities too)
//   s o g                strings
//   ay                   data
//   (d)                  a date, seconds since 1970
//   a{s…}                a dictionary; of entries with the same key the last one counts
//   a…                   an array
//   v                    the value inside
//
// Everything else is unsupported: file descriptors, other structs, dictionaries with other keys
// (also when an array of these is empty), and nesting of more than kMaxNesting levels.
//
// Takes time and memory in proportion to the size of the frame at worst, and allocates nothing but
// the values. Any thread may call it.
[[nodiscard]] std::optional<DecodeError> decodeBody(const Frame& frame,
                                                    std::string_view expectedSignature,
                                                    std::vector<Value>& arguments);

}  // namespace halvox::platform::linux_::dbus
