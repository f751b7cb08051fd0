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
  // keys and element numbers (from 0) inside the argument, as in `argument 1, key "a"."b"[3]`. Long
  // keys are cut. Empty for kWrongSignature.
  std::string key;
  // The signature of the value; empty if it is not known. Long malformed signatures are cut.
  std::string signature;
  // One line of valid UTF-8 with the place and the signature, for the log and for the answer to the
  // client.
  std::string message;
};

// Parts of earlier bodies that are decoded already. They make decoding faster and never change the
// result. Belongs to one thread.
struct DecodeCaches {
  KeyCache keys;
  TailCache tails;
};

// Memory that decoding one body leaves for the next. A caller that decodes many bodies uses one
// scratch for all of them. Belongs to one thread.
struct DecodeScratch {
  // The elements of the containers that are being decoded, those of the innermost container last.
  // Empty between calls. The elements gather here, because the size of a container is known only
  // after its last element, and a container whose size is known is allocated only once.
  std::vector<Value> values{};
  std::vector<Dictionary::Entry> entries{};
  // Useful if bodies resemble each other. If null, each body is decoded as if it were the first.
  std::unique_ptr<DecodeCaches> caches{};
  // How many entries the receiver of the arguments will add to a dictionary that is an argument.
  // The dictionary is allocated with space for them.
  std::size_t addedEntries = 0;

  // Removes the elements. Frees memory that only an unusually large message needed.
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
// Does the same as decodeBody() above with a temporary scratch, for occasional messages.
[[nodiscard]] std::optional<DecodeError> decodeBody(const Frame& frame,
                                                    std::string_view expectedSignature,
                                                    std::vector<Value>& arguments);

}  // namespace halvox::platform::linux_::dbus
