#include "platform/linux/base/Utf8.h"

#include <algorithm>
#include <array>
#include <cstdint>
#include <cstdio>
#include <cstring>

namespace halvox::platform::linux_ {
namespace {

constexpr std::string_view kReplacement = "\xEF\xBF\xBD";
constexpr std::size_t kWordSize = sizeof(std::uint64_t);
// Words with the same value in each of their bytes.
constexpr std::uint64_t kEachByte = 0x0101010101010101;
constexpr std::uint64_t kEachHighBit = 0x8080808080808080;

enum class Nul : bool { kAllowed, kRefused };

// Returns true if all eight bytes are ASCII and, if a NUL is refused, none is NUL. The test for a
// NUL subtracts one from each byte, which sets the high bit of a NUL.
template <Nul kNul>
bool isPlainWord(const char* bytes) {
  std::uint64_t word = 0;
  std::memcpy(&word, bytes, sizeof word);
  if constexpr (kNul == Nul::kRefused) word |= word - kEachByte;
  return (word & kEachHighBit) == 0;
}

template <Nul kNul>
bool isPlainByte(unsigned char byte) {
  return byte < 0x80 && (kNul == Nul::kAllowed || byte != 0);
}

// The bytes that may follow a lead byte. The bounds of the second byte exclude overlong forms,
// surrogates and numbers above U+10FFFF.
struct Sequence {
  std::size_t length;
  unsigned char secondMin;
  unsigned char secondMax;
};

Sequence sequenceAfter(unsigned char lead) {
  if (lead >= 0xC2 && lead <= 0xDF) return {2, 0x80, 0xBF};
  if (lead == 0xE0) return {3, 0xA0, 0xBF};
  if (lead == 0xED) return {3, 0x80, 0x9F};
  if (lead >= 0xE1 && lead <= 0xEF) return {3, 0x80, 0xBF};
  if (lead == 0xF0) return {4, 0x90, 0xBF};
  if (lead >= 0xF1 && lead <= 0xF3) return {4, 0x80, 0xBF};
  if (lead == 0xF4) return {4, 0x80, 0x8F};
  return {0, 0, 0};
}

// Returns the length of the multi-byte character at the start of `text`; 0 if there is none.
std::size_t multiByteLength(std::string_view text) {
  const auto byteAt = [text](std::size_t index) { return static_cast<unsigned char>(text[index]); };
  const Sequence sequence = sequenceAfter(byteAt(0));
  if (sequence.length == 0 || sequence.length > text.size()) return 0;
  if (byteAt(1) < sequence.secondMin || byteAt(1) > sequence.secondMax) return 0;
  for (std::size_t index = 2; index < sequence.length; ++index) {
    if (!continuesUtf8(text[index])) return 0;
  }
  return sequence.length;
}

template <Nul kNul>
bool isValid(std::string_view text) {
  std::size_t position = 0;
  while (position < text.size()) {
    if (text.size() - position >= kWordSize && isPlainWord<kNul>(text.data() + position)) {
      position += kWordSize;
    } else if (isPlainByte<kNul>(static_cast<unsigned char>(text[position]))) {
      ++position;
    } else {
      const std::size_t length = multiByteLength(text.substr(position));
      if (length == 0) return false;
      position += length;
    }
  }
  return true;
}

bool isPlain(char character) { return character >= 0x20 && character < 0x7F; }

// Includes the control characters above ASCII, and the line and paragraph separators (U+2028 and
// U+2029), at which some programs break lines.
bool isUnprintable(char32_t character) {
  return character < 0x20 || (character >= 0x7F && character < 0xA0) || character == 0x2028 ||
         character == 0x2029;
}

std::string hexEscape(const char* format, char32_t number) {
  std::array<char, 16> text{};
  std::snprintf(text.data(), text.size(), format, static_cast<unsigned>(number));
  return text.data();
}

std::string escaped(char32_t character) {
  switch (character) {
    case '\n':
      return "\\n";
    case '\r':
      return "\\r";
    case '\t':
      return "\\t";
    default:
      break;
  }
  return character < 0x80 ? hexEscape("\\x%02x", character) : hexEscape("\\u%04x", character);
}

}  // namespace

Utf8Step nextUtf8(std::string_view text) {
  const auto lead = static_cast<unsigned char>(text.front());
  if (lead < 0x80) return {.length = 1, .valid = true, .character = lead};
  const std::size_t length = multiByteLength(text);
  if (length == 0) return {};
  // A lead byte has as many set high bits as the character has bytes, and a cleared one below them.
  char32_t character = lead & (0x7FU >> length);
  for (std::size_t index = 1; index < length; ++index) {
    character = (character << 6U) | (static_cast<unsigned char>(text[index]) & 0x3FU);
  }
  return {.length = length, .valid = true, .character = character};
}

bool isUtf8(std::string_view text) { return isValid<Nul::kAllowed>(text); }

bool isUtf8WithoutNul(std::string_view text) { return isValid<Nul::kRefused>(text); }

std::string_view utf8Prefix(std::string_view text, std::size_t most) {
  if (text.size() <= most) return text;
  std::size_t length = most;
  while (length > 0 && continuesUtf8(text[length])) --length;
  return text.substr(0, length);
}

std::string replaceInvalidUtf8(std::string_view text) {
  std::string result;
  result.reserve(text.size());
  while (!text.empty()) {
    const Utf8Step step = nextUtf8(text);
    result += step.valid ? text.substr(0, step.length) : kReplacement;
    text.remove_prefix(step.length);
  }
  return result;
}

std::size_t appendEscaped(std::string& line, std::string_view text, std::size_t room) {
  std::size_t taken = 0;
  while (taken < text.size()) {
    const std::string_view rest = text.substr(taken);
    const auto end = std::ranges::find_if_not(rest, isPlain);
    // Append plain characters as one run, because nearly all texts consist of plain characters
    // only.
    if (const auto plain = static_cast<std::size_t>(end - rest.begin()); plain > 0) {
      const std::size_t fitting = std::min(plain, room);
      line += rest.substr(0, fitting);
      room -= fitting;
      taken += fitting;
      if (fitting < plain) break;
      continue;
    }
    const Utf8Step step = nextUtf8(rest);
    const std::string part =
        !step.valid ? hexEscape("\\x%02x", static_cast<unsigned char>(rest.front()))
        : isUnprintable(step.character) ? escaped(step.character)
                                        : std::string(rest.substr(0, step.length));
    // Never cut an escape, because a part of it would have another meaning.
    if (part.size() > room) break;
    line += part;
    room -= part.size();
    taken += step.length;
  }
  return taken;
}

}  // namespace halvox::platform::linux_
