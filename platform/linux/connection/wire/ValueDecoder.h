#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/connection/wire/Frame.h"
#include "platform/linux/connection/wire/KeyCache.h"
#include "platform/linux/connection/wire/TailCache.h"
#include "platform/value.h"

namespace halvox::platform::linux_::dbus {

// Why the body of a message could not be decoded.
struct DecodeError {
  enum class Kind : std::uint8_t {
    kMalformed,       // the bytes break the rules of the wire; the connection must be closed
    kUnsupported,     // a valid message with a value of an unsupported type
    kWrongSignature,  // a valid message whose arguments are not the expected ones
  };
  Kind kind = Kind::kMalformed;
  // The place of the value: the number of the argument, counted from 1, and the path of dictionary
  // keys and element numbers (from 0) inside it, as in `argument 1, key "a"."b"[3]`. Long keys are
  // cut. Empty for a wrong signature.
  std::string key;
  // The signature of the value; empty if it is not known. Cut if it is malformed and long.
  std::string signature;
  // One line of valid UTF-8 with the place and the signature, for the log and for the answer to the
  // client.
  std::string message;
};

// What earlier bodies contained. It makes decoding faster and never changes the result. Belongs to
// one thread.
struct DecodeCaches {
  KeyCache keys;
  TailCache tails;
};

// What decoding one body leaves for the next. A caller that decodes many bodies keeps one for all
// of them. Belongs to one thread.
struct DecodeScratch {
  // The elements of containers that are being decoded, innermost last; empty between calls. Arrays
  // and dictionaries are made with their final size, which is known only after their last element.
  // Without these, each container would be allocated twice.
  std::vector<Value> values{};
  std::vector<Dictionary::Entry> entries{};
  // For bodies that resemble each other. If null, each body is decoded as if it were the first.
  std::unique_ptr<DecodeCaches> caches{};
  // How many entries the receiver adds to a dictionary that is an argument. The dictionary is made
  // with room for them.
  std::size_t addedEntries = 0;

  // Empties the elements. Gives memory back that only an unusually large message needed.
  void clear();
};

// Decodes the body of a frame, whose arguments must have exactly the expected signature, into
// `arguments`. Replaces their content; they are empty after an error.
//
//   y n q i u x t, d, b  numbers of that kind (NaN and infinities too)
//   s o g                strings
//   ay                   data
//   (d)                  a date, seconds since 1970
//   a{s…}                a dictionary; of entries with the same key the last one is kept
//   a…                   an array
//   v                    the value inside
//
// Everything else is unsupported: file descriptors, other structs, dictionaries with other keys
// (even an empty array of these), and nesting of more than kMaxNesting levels.
//
// Time and memory are at worst proportional to the size of the frame. Allocates only the values,
// once `arguments` and `scratch` have their capacity. Any thread may call it.
[[nodiscard]] std::optional<DecodeError> decodeBody(const Frame& frame,
                                                    std::string_view expectedSignature,
                                                    std::vector<Value>& arguments,
                                                    DecodeScratch& scratch);
// Does the same with a scratch of its own, for occasional messages.
[[nodiscard]] std::optional<DecodeError> decodeBody(const Frame& frame,
                                                    std::string_view expectedSignature,
                                                    std::vector<Value>& arguments);

}  // namespace halvox::platform::linux_::dbus
