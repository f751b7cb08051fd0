#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace halvox::platform::linux_::dbus {

// Makes text for a log line from untrusted bytes. Printable ASCII and valid UTF-8 stay as they are,
// everything else is escaped, and long texts are cut. The result is always valid UTF-8.
[[nodiscard]] std::string quotable(std::string_view text);

// A place in the arguments of a message, such as `argument 1, key "a"."b"[3]`. After an error, each
// container adds its step in front while the decoder leaves it, from the innermost to the
// outermost. Decoding without an error therefore costs nothing extra.
class DecodePath {
 public:
  void putBefore(std::string_view key);
  void putBefore(std::size_t element);
  // Sets the number of the argument, counted from 1.
  void setArgument(std::size_t number) { argument_ = number; }

  // Returns the path as text; empty if not even the argument is known.
  [[nodiscard]] std::string text() const;

 private:
  std::string steps_;
  std::size_t argument_ = 0;
};

}  // namespace halvox::platform::linux_::dbus
