#pragma once

#include <cstdint>
#include <span>
#include <string>
#include <string_view>

#include "platform/value.h"

// These functions append a whole frame, little endian, to `out`. Any thread may call them.
//
// A function returns false and leaves `out` unchanged if the message cannot be encoded: a value
// does not fit its signature, a text is not UTF-8 or contains a NUL, a name or path is invalid, a
// serial is 0, containers are nested more than kMaxNesting levels deep (dictionary entries count
// here, because some readers count them), or an array or the message exceeds the limits of D-Bus.
// The functions allocate no memory except that of `out`.
namespace halvox::platform::linux_::dbus {

// The call that a reply answers. `destination` is the caller's bus name; empty without a bus.
struct ReplyTo {
  std::uint32_t serial = 0;
  std::string_view destination;
};

// The target of a call. `destination` and `interface` may be empty. For a signal: its sender's
// object and its receiver; the interface must not be empty.
struct CallTarget {
  std::string_view destination;
  std::string_view path;
  std::string_view interface;
  std::string_view member;
};

// A reply with one value of the given type, or without a value if the signature is empty.
//
// A number is encoded as the integer or floating-point type of the signature. A number outside the
// range of that type becomes the nearest number in the range. Any number can be encoded as a
// boolean. `(d)` takes a date, `ay` data or an array of numbers, `a{s…}` a dictionary, other arrays
// an array, `o` and `g` a string that is valid as such. Other structs, file descriptors,
// dictionaries with other keys and the absent value cannot be encoded. The type of a variant
// follows from its value. A number has the type of its kind (a float has `d`); other values have
// `s`, `(d)`, `ay` or `a{sv}`. An array whose elements all have one type is an array of that type;
// any other array is `av`.
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

// A signal. `signature` has one complete type for each argument.
[[nodiscard]] bool appendSignal(std::string& out, std::uint32_t serial, const CallTarget& target,
                                std::string_view signature, std::span<const Value> arguments);

}  // namespace halvox::platform::linux_::dbus
