#pragma once

#include <algorithm>
#include <array>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <span>
#include <string_view>

#include "client/WireParts.h"
#include "platform/value.h"

// Single values before they are encoded. Each type refers to its content, which the caller owns.
// There are three functions for each type:
//
//   putVariant()     writes the variant of the value, and returns the end
//   variantRoom()    the most bytes that putVariant() touches
//   variantLevels()  the levels of nesting of the variant
namespace halvox::client {

// Levels of nesting are counted only up to this number, which is more than the wire allows.
inline constexpr unsigned kMostLevels = 255;

struct WireNumber {
  char type = 0;
  std::uint8_t size = 0;  // and alignment
  std::array<char, 8> bytes{};
};
struct WireText {
  std::string_view text;
};
struct WireData {
  std::span<const std::byte> bytes;
};
// The elements of an array, encoded for both places where they can begin: a multiple of 8, and 4
// bytes after one.
struct WireArray {
  std::span<const char> atEight;
  std::span<const char> atFour;
  unsigned levels = 0;  // of the deepest element
};
struct WireDictionary {
  std::span<const char> entries;
  unsigned levels = 0;  // of the deepest value
};

template <typename Number>
WireNumber makeWireNumber(char type, Number number) {
  WireNumber made{type, sizeof number, {}};
  std::memcpy(made.bytes.data(), &number, sizeof number);
  return made;
}

// Returns the number in the type that it has on the wire. A number keeps its type, except that a
// signed byte is sent as 16 bits and a float as a double.
template <platform::ArithmeticNumber Number>
WireNumber wireNumber(Number number) {
  if constexpr (std::same_as<Number, bool>) {
    return makeWireNumber('b', static_cast<std::uint32_t>(number));
  } else if constexpr (std::floating_point<Number>) {
    return makeWireNumber('d', static_cast<double>(number));
  } else if constexpr (std::signed_integral<Number>) {
    if constexpr (sizeof(Number) <= 2) return makeWireNumber('n', std::int16_t{number});
    if constexpr (sizeof(Number) == 4) return makeWireNumber('i', number);
    if constexpr (sizeof(Number) == 8) return makeWireNumber('x', number);
  } else {
    if constexpr (sizeof(Number) == 1) return makeWireNumber('y', number);
    if constexpr (sizeof(Number) == 2) return makeWireNumber('q', number);
    if constexpr (sizeof(Number) == 4) return makeWireNumber('u', number);
    if constexpr (sizeof(Number) == 8) return makeWireNumber('t', number);
  }
}

inline char* putVariant(char* at, const WireNumber& number) {
  at = padded(putSignature(at, number.type), number.size);
  std::memcpy(at, number.bytes.data(), number.bytes.size());
  return at + number.size;
}
inline std::size_t variantRoom(const WireNumber& /*number*/) { return kNumberRoom; }
inline unsigned variantLevels(const WireNumber& /*number*/) { return 1; }

template <std::size_t kSize>
char* putLongSignature(char* at, const char (&signature)[kSize]) {
  at = put(at, static_cast<std::uint8_t>(kSize - 1));
  std::memcpy(at, signature, kSize);
  return at + kSize;
}

inline char* putVariant(char* at, platform::Date date) {
  return put(padded(putLongSignature(at, "(d)"), 8), date.secondsSince1970);
}
inline std::size_t variantRoom(platform::Date /*date*/) { return kNumberRoom; }
inline unsigned variantLevels(platform::Date /*date*/) { return 2; }

// Writes padding and a length of 32 bits. A message that would need a longer one is refused before
// it is sent.
inline char* putLength(char* at, std::size_t length) {
  return put(padded(at, 4), static_cast<std::uint32_t>(length));
}

inline char* putVariant(char* at, const WireText& text) {
  return copyText(putLength(putSignature(at, 's'), text.text.size()), text.text);
}
inline std::size_t variantRoom(const WireText& text) { return text.text.size() + kNumberRoom; }
inline unsigned variantLevels(const WireText& /*text*/) { return 1; }

template <typename Byte>
char* putBytes(char* at, std::span<Byte> bytes) {
  if (!bytes.empty()) std::memcpy(at, bytes.data(), bytes.size());
  return at + bytes.size();
}

inline char* putVariant(char* at, const WireData& data) {
  return putBytes(putLength(putLongSignature(at, "ay"), data.bytes.size()), data.bytes);
}
inline std::size_t variantRoom(const WireData& data) { return data.bytes.size() + kNumberRoom; }
inline unsigned variantLevels(const WireData& /*data*/) { return 2; }

inline char* putVariant(char* at, const WireArray& array) {
  // Up to 3 bytes of padding come first, then the length, then the elements.
  at = padded(putLongSignature(at, "av"), 4);
  const bool beginsAtEight = reinterpret_cast<std::uintptr_t>(at) % 8 == 4;
  const auto elements = beginsAtEight ? array.atEight : array.atFour;
  return putBytes(putLength(at, elements.size()), elements);
}
inline std::size_t variantRoom(const WireArray& array) {
  return std::max(array.atEight.size(), array.atFour.size()) + kNumberRoom;
}
inline unsigned variantLevels(const WireArray& array) {
  return std::min(array.levels + 2, kMostLevels);
}

inline char* putVariant(char* at, const WireDictionary& dictionary) {
  at = putLength(putLongSignature(at, "a{sv}"), dictionary.entries.size());
  return putBytes(padded(at, 8), dictionary.entries);
}
inline std::size_t variantRoom(const WireDictionary& dictionary) {
  return dictionary.entries.size() + kNumberRoom + 8;
}
inline unsigned variantLevels(const WireDictionary& dictionary) {
  return std::min(dictionary.levels + 2, kMostLevels);
}

}  // namespace halvox::client
