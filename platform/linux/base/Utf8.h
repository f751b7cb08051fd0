#pragma once

#include <cstddef>
#include <string>
#include <string_view>

namespace halvox::platform::linux_ {

// UTF-8 for the outer ring and the client library. Valid UTF-8 has no overlong forms, no surrogates
// and nothing above U+10FFFF. All functions take any bytes, and any thread may call them.
//
// The inner ring cannot include this header. session/SummaryFileName.cpp therefore has its own code
// to cut valid text between two characters, and the fake process service its own code to replace
// invalid bytes. The contract suite runs the same tests on that fake and on the adapter, which uses
// this header.

// One step through bytes that should be UTF-8.
struct Utf8Step {
  std::size_t length = 1;  // bytes of the character; 1 if the byte does not begin one
  bool valid = false;
  char32_t character = 0;  // of a valid step
};

// Returns the character at the start of `text`, which must not be empty.
[[nodiscard]] Utf8Step nextUtf8(std::string_view text);

// Returns true for valid UTF-8. Tests ASCII eight bytes at a time.
[[nodiscard]] bool isUtf8(std::string_view text);

// Returns true for valid UTF-8 without a NUL, which is what D-Bus and C take as a text. It runs for
// every message and therefore makes one pass. A separate search for the NUL would read the text
// twice.
[[nodiscard]] bool isUtf8WithoutNul(std::string_view text);

// Returns true for a byte that continues a character.
[[nodiscard]] constexpr bool continuesUtf8(char byte) {
  return (static_cast<unsigned char>(byte) & 0xC0U) == 0x80U;
}

// Returns the longest prefix of `text` that has at most `most` bytes and does not end inside a
// character. If `text` is not valid, invalid bytes near the cut may be removed, too.
[[nodiscard]] std::string_view utf8Prefix(std::string_view text, std::size_t most);

// Returns `text` with each byte that is not part of valid UTF-8 replaced by U+FFFD.
[[nodiscard]] std::string replaceInvalidUtf8(std::string_view text);

// Appends `text` so that it stays on one line and cannot drive a terminal: control characters and
// line separators as escapes (\n, \t, \x1b, \u2028), bytes that are not UTF-8 as \xNN. Stops before
// the first character that would make more than `room` bytes. Returns how many bytes of `text` were
// appended.
std::size_t appendEscaped(std::string& line, std::string_view text, std::size_t room);

}  // namespace halvox::platform::linux_
