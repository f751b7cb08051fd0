#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <string_view>

#include "platform/linux/base/Utf8.h"
#include "platform/value.h"

// Functions that write the parts of values on the wire: texts, padding, signatures and numbers.
// Each function writes at an address that has the same alignment as its place in the frame, and
// returns the end of what it wrote. The code is inline because every function call costs time on
// the caller's thread.
namespace halvox::client {

inline constexpr std::uint64_t kEachHighBit = 0x8080808080808080;

// Sets the high bit of each byte that is a NUL or not ASCII. May also set that of the byte after a
// NUL.
inline std::uint64_t highBits(std::uint64_t word) {
  constexpr std::uint64_t kEachByte = 0x0101010101010101;
  return word | (word - kEachByte);  // subtracting one from a NUL sets its high bit
}

template <typename Number>
inline Number load(const char* from) {
  Number number;
  std::memcpy(&number, from, sizeof number);
  return number;
}

// Returns true if the text is ASCII without NUL. Nearly all texts are, and are spared the full
// test, which checks the last bytes one by one.
inline bool isPlainText(std::string_view text) {
  constexpr std::size_t kWord = sizeof(std::uint64_t);
  const auto signs = [&](std::size_t at) {
    return highBits(load<std::uint64_t>(text.data() + at));
  };
  if (text.size() < kWord) {
    bool plain = true;
    for (const char character : text) plain &= static_cast<signed char>(character) > 0;
    return plain;
  }
  std::uint64_t all = signs(text.size() - kWord);
  for (std::size_t at = 0; at + kWord <= text.size(); at += kWord) all |= signs(at);
  return (all & kEachHighBit) == 0;
}

inline bool isWireText(std::string_view text) {
  return isPlainText(text) || platform::linux_::isUtf8WithoutNul(text);
}

// Copies a text. The length is usually small and not a constant, and memcpy() would therefore be a
// function call.
inline char* copyText(char* to, std::string_view text) {
  const std::size_t size = text.size();
  if (size >= 8 && size <= 32) {
    const char* from = text.data();
    std::memcpy(to, from, 8);
    if (size > 16) {
      std::memcpy(to + 8, from + 8, 8);
      std::memcpy(to + size - 16, from + size - 16, 8);
    }
    std::memcpy(to + size - 8, from + size - 8, 8);
  } else {
    std::memcpy(to, text.data(), size);
  }
  to[size] = '\0';
  return to + size + 1;
}

// Appends zeros up to a multiple of 8 or 4, and returns that address. Always writes 8 bytes; the
// last of them may be after the returned address.
inline char* padded(char* at, std::size_t alignment) {
  std::memset(at, 0, 8);
  return at + ((0 - reinterpret_cast<std::uintptr_t>(at)) & (alignment - 1));
}

template <typename Number>
inline char* put(char* at, Number number) {
  std::memcpy(at, &number, sizeof number);
  return at + sizeof number;
}

// Appends the signature of one basic type, which has three bytes. Also writes a zero after it,
// because four bytes are one store, whereas three bytes would go through the stack.
inline char* putSignature(char* at, char type) {
  const char bytes[4] = {1, type, 0, 0};
  std::memcpy(at, bytes, sizeof bytes);
  return at + 3;
}

template <typename Number>
inline char* putNumber(char* at, char type, Number number) {
  at = putSignature(at, type);
  return put(padded(at, sizeof number), number);
}

inline char* putNumber(char* at, const platform::Value& value) {
  switch (value.numberKind()) {
    case platform::NumberKind::kBool:
      return putNumber(at, 'b', static_cast<std::uint32_t>(value.toBool()));
    case platform::NumberKind::kUInt8:
      return put(putSignature(at, 'y'), static_cast<std::uint8_t>(value.toUInt64()));
    case platform::NumberKind::kInt16:
      return putNumber(at, 'n', static_cast<std::int16_t>(value.toInt64()));
    case platform::NumberKind::kUInt16:
      return putNumber(at, 'q', static_cast<std::uint16_t>(value.toUInt64()));
    case platform::NumberKind::kInt32:
      return putNumber(at, 'i', static_cast<std::int32_t>(value.toInt64()));
    case platform::NumberKind::kUInt32:
      return putNumber(at, 'u', static_cast<std::uint32_t>(value.toUInt64()));
    case platform::NumberKind::kInt64:
      return putNumber(at, 'x', value.toInt64());
    case platform::NumberKind::kUInt64:
      return putNumber(at, 't', value.toUInt64());
    case platform::NumberKind::kFloat:
    case platform::NumberKind::kDouble:
      return putNumber(at, 'd', value.toDouble());
  }
  return at;
}

// Appends padding and the key of a dictionary's entry.
inline char* putKey(char* at, std::string_view key) {
  return copyText(put(padded(at, 8), static_cast<std::uint32_t>(key.size())), key);
}

// The most bytes that a signature, padding and a number need, including those that padded() writes.
constexpr std::size_t kNumberRoom = 24;
// The bytes that an entry needs in addition to its texts: padding, two lengths, two NULs and a
// signature.
constexpr std::size_t kEntryRoom = 16 + kNumberRoom;

}  // namespace halvox::client
