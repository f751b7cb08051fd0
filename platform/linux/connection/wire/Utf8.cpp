#include "platform/linux/connection/wire/Utf8.h"

#include <cstddef>
#include <cstdint>
#include <cstring>

namespace halvox::platform::linux_::dbus {
namespace {

// One byte of each is set in every byte of the word.
constexpr std::uint64_t kEachByte = 0x0101010101010101;
constexpr std::uint64_t kEachHighBit = 0x8080808080808080;

// All eight are ASCII and none is NUL: taking one off a NUL sets its high bit.
bool isPlainWord(const char* bytes) {
  std::uint64_t word = 0;
  std::memcpy(&word, bytes, sizeof word);
  return (((word - kEachByte) | word) & kEachHighBit) == 0;
}

bool isPlainByte(unsigned char byte) { return byte != 0 && byte < 0x80; }

// What may follow a lead byte. The bounds of the second byte keep out overlong forms, surrogates
// and numbers past the last one.
struct Sequence {
  std::size_t length;
  unsigned char secondMin;
  unsigned char secondMax;
};

Sequence sequenceAfter(unsigned char lead) {
  if (lead >= 0xc2 && lead <= 0xdf) return {2, 0x80, 0xbf};
  if (lead == 0xe0) return {3, 0xa0, 0xbf};
  if (lead == 0xed) return {3, 0x80, 0x9f};
  if (lead >= 0xe1 && lead <= 0xef) return {3, 0x80, 0xbf};
  if (lead == 0xf0) return {4, 0x90, 0xbf};
  if (lead >= 0xf1 && lead <= 0xf3) return {4, 0x80, 0xbf};
  if (lead == 0xf4) return {4, 0x80, 0x8f};
  return {0, 0, 0};
}

// The length of the sequence of several bytes at the start of `text`, 0 when there is none.
std::size_t multiByteLength(std::string_view text) {
  const auto byteAt = [text](std::size_t index) { return static_cast<unsigned char>(text[index]); };
  const Sequence sequence = sequenceAfter(byteAt(0));
  if (sequence.length == 0 || sequence.length > text.size()) return 0;
  if (byteAt(1) < sequence.secondMin || byteAt(1) > sequence.secondMax) return 0;
  for (std::size_t index = 2; index < sequence.length; ++index) {
    if ((byteAt(index) & 0xc0) != 0x80) return 0;
  }
  return sequence.length;
}

}  // namespace

bool isWireText(std::string_view text) {
  std::size_t position = 0;
  while (position < text.size()) {
    if (text.size() - position >= 8 && isPlainWord(text.data() + position)) {
      position += 8;
    } else if (isPlainByte(static_cast<unsigned char>(text[position]))) {
      ++position;
    } else {
      const std::size_t length = multiByteLength(text.substr(position));
      if (length == 0) return false;
      position += length;
    }
  }
  return true;
}

}  // namespace halvox::platform::linux_::dbus
