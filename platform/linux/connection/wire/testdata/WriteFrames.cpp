// Prints frames that our encoder wrote, for another implementation to read. Each line has the frame
// in hexadecimal, a tab, and the body in GLib's text form ("-" for an empty body).

#include <cmath>
#include <iostream>
#include <limits>
#include <string>
#include <vector>

#include "platform/linux/base/Hexadecimal.h"
#include "platform/linux/connection/wire/FrameWriter.h"
#include "platform/linux/connection/wire/testdata/TestFrames.h"

namespace halvox::platform::linux_::dbus {
namespace {

// Returns false if the frame could not be written.
bool print(bool written, std::string_view frame, std::string_view body) {
  if (written) std::cout << hexadecimal(frame) << '\t' << body << '\n';
  return written;
}

struct Reply {
  std::string_view signature;
  Value value;
  std::string_view body;
};

std::vector<Reply> replies() {
  const Dictionary inner{{"k", Array{Date{1}, Date{2.5}}}, {"ü", "€"}};
  return {
      {"", Value(), "-"},
      {"b", true, "(true,)"},
      {"y", 7, "(byte 0x07,)"},
      {"n", -2, "(int16 -2,)"},
      {"q", 18, "(uint16 18,)"},
      {"i", -5, "(-5,)"},
      {"u", 5, "(uint32 5,)"},
      {"x", std::numeric_limits<std::int64_t>::min(), "(int64 -9223372036854775808,)"},
      {"t", std::numeric_limits<std::uint64_t>::max(), "(uint64 18446744073709551615,)"},
      {"d", 0.75, "(0.75,)"},
      {"s", "text", "('text',)"},
      {"o", "/a/b", "(objectpath '/a/b',)"},
      {"g", "a{sv}", "(signature 'a{sv}',)"},
      {"ay", Data(asBytes({"\x00\xff", 2})), "([byte 0x00, 0xff],)"},
      {"(d)", Date{1.5}, "((1.5,),)"},
      {"ax", Array{1, 2, 3}, "([int64 1, 2, 3],)"},
      {"ax", Array{}, "(@ax [],)"},
      {"as", Array{"a", "b"}, "(['a', 'b'],)"},
      {"aax", Array{Array{}, Array{1}}, "([[], [int64 1]],)"},
      {"a{sv}", Dictionary{{"reporter", inner}, {"valid", true}},
       "({'reporter': <{'k': <[(1.0,), (2.5,)]>, '\\u00fc': <'\\u20ac'>}>, 'valid': <true>},)"},
      {"a{sx}", Dictionary{{"a", 1}}, "({'a': int64 1},)"},
      {"a(d)", Array{Date{1}, Date{2}}, "([(1.0,), (2.0,)],)"},
      {"v", Array{1, "two", Array{}, Dictionary{}}, "(<[<1>, <'two'>, <@av []>, <@a{sv} {}>]>,)"},
      {"v", Array{std::uint16_t{1}, std::uint16_t{2}}, "(<[uint16 1, 2]>,)"},
  };
}

bool printReplies() {
  for (const std::string_view destination : {"", ":1.42"}) {
    for (const Reply& reply : replies()) {
      std::string frame;
      const ReplyTo to{9, destination};
      const bool written = appendMethodReturn(frame, to, 3, reply.signature, reply.value);
      if (!print(written, frame, reply.body)) return false;
    }
  }
  return true;
}

bool printOthers() {
  std::string error;
  const bool hasError = appendError(error, {9, ":1.2"}, 4, "com.tarno.Failed", "went wrong");
  if (!print(hasError, error, "('went wrong',)")) return false;

  const CallTarget bus{"org.freedesktop.DBus", "/org/freedesktop/DBus", "org.freedesktop.DBus",
                       "RequestName"};
  const std::vector<Value> arguments{"com.tarno.halvox.reporting", 4};
  std::string call;
  const bool hasCall = appendMethodCall(call, 5, bus, "su", arguments);
  return print(hasCall, call, "('com.tarno.halvox.reporting', uint32 4)");
}

}  // namespace
}  // namespace halvox::platform::linux_::dbus

int main() {
  using namespace halvox::platform::linux_::dbus;
  return printReplies() && printOthers() ? 0 : 1;
}
