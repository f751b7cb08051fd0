#pragma once

#include <cstdint>
#include <span>
#include <string>
#include <string_view>

#include "platform/value.h"

// Writers of whole frames, little endian, behind what is already in `out`.
//
// Each returns false and leaves `out` as it was when what it is given has no form on the wire: a
// value that does not fit its signature, text that is not UTF-8 or has a NUL in it, a name or path
// that is not valid, a serial of 0, nesting of more than kMaxNesting containers (where the entries
// of a dictionary count too, as some readers count them), an array or message over the wire's
// limits. Their allocation is that of `out` growing.
namespace halvox::platform::linux_::dbus {

// The call that a reply answers. `destination` is the caller's name on a bus; empty without a bus.
struct ReplyTo {
  std::uint32_t serial = 0;
  std::string_view destination;
};

// Where a call goes. `destination` and `interface` may be empty.
struct CallTarget {
  std::string_view destination;
  std::string_view path;
  std::string_view interface;
  std::string_view member;
};

// A reply with one value of the given type, or, when the signature is empty, with none.
//
// Numbers take the integer or floating-point type asked for (what lies outside its range becomes
// the nearest end), any number can be a boolean. `(d)` takes a date, `ay` data or an array of
// numbers, `a{s…}` a dictionary, other arrays an array, `o` and `g` a string that is a valid one.
// Other structs, file descriptors and dictionaries with other keys have no form, nor has no value
// at all. A variant holds the natural type: that of the number's kind (`d` for a float), `s`,
// `(d)`, `ay`, `a{sv}`; an array whose elements have one type is an array of that type, any other
// is `av`.
[[nodiscard]] bool appendMethodReturn(std::string& out, const ReplyTo& replyTo,
                                      std::uint32_t serial, std::string_view signature,
                                      const Value& value);

// An error reply: its name, and a text for people.
[[nodiscard]] bool appendError(std::string& out, const ReplyTo& replyTo, std::uint32_t serial,
                               std::string_view errorName, std::string_view message);

// A call of a method whose reply is expected. `signature` has one complete type for each argument.
[[nodiscard]] bool appendMethodCall(std::string& out, std::uint32_t serial,
                                    const CallTarget& target, std::string_view signature,
                                    std::span<const Value> arguments);

}  // namespace halvox::platform::linux_::dbus
