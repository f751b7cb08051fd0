#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace halvox::platform::linux_::dbus {

// Text of outside bytes that a line of a log can quote: printable ASCII and UTF-8 as they are,
// everything else escaped, and cut when it is long. Always valid UTF-8.
[[nodiscard]] std::string quotable(std::string_view text);

// Says where in the arguments of a message something is, as `argument 1, key "a"."b"[3]`.
// Built from the inside out, by whoever leaves a container because of an error.
class DecodePath {
 public:
  void putBefore(std::string_view key);
  void putBefore(std::size_t element);
  // The number of the argument, counted from 1.
  void setArgument(std::size_t number) { argument_ = number; }

  // Empty when not even the argument is known.
  [[nodiscard]] std::string text() const;

 private:
  std::string steps_;
  std::size_t argument_ = 0;
};

}  // namespace halvox::platform::linux_::dbus
