#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace halvox::platform::linux_ {

// One step through bytes that should be UTF-8.
struct Utf8Step {
  std::size_t length = 1;  // bytes of the character, or 1 for a byte that is no part of one
  bool valid = false;
  char32_t character = 0;  // of a valid step
};

// The character at the start of `text`, which must not be empty. Overlong forms, surrogates and
// what lies beyond U+10FFFF are not valid.
Utf8Step nextUtf8(std::string_view text);

// `text` with each byte that is not UTF-8 replaced by U+FFFD.
std::string replaceInvalidUtf8(std::string_view text);

// Appends `text` so that it stays on one line and cannot drive a terminal: control characters and
// line separators as escapes (\n, \t, \x1b, \u2028), bytes that are not UTF-8 as \xNN. Stops before
// the first character that would make more than `room` bytes; returns the bytes of `text` taken.
std::size_t appendEscaped(std::string& line, std::string_view text, std::size_t room);

}  // namespace halvox::platform::linux_
