#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <span>
#include <string_view>

#include "platform/linux/base/Utf8.h"

namespace halvox::platform::linux_::dbus {

// Reads the basic types of the wire one after the other from bytes whose first one stands on an
// 8-byte boundary of the message, with all checks that concern a single value.
//
// Every read… returns false when the bytes break a rule; `problem()` then says which, and the
// reader is of no further use. Texts that it gives point into the bytes, whose owner is the caller.
class WireReader {
 public:
  WireReader(std::span<const std::byte> bytes, bool bigEndian)
      : bytes_(reinterpret_cast<const char*>(bytes.data())),
        limit_(bytes.size()),
        swapped_(bigEndian != kHostIsBigEndian) {}

  [[nodiscard]] std::size_t position() const { return position_; }
  [[nodiscard]] bool atLimit() const { return position_ == limit_; }
  [[nodiscard]] std::string_view problem() const { return problem_; }

  // Notes what is wrong, and returns false.
  bool fail(std::string_view problem) {
    problem_ = problem;
    return false;
  }

  // Goes on at the next such boundary. Padding must be zero.
  bool align(std::size_t alignment) {
    const std::size_t aligned = (position_ + alignment - 1) & ~(alignment - 1);
    if (aligned > limit_) return fail(kEndsTooEarly);
    while (position_ < aligned) {
      if (bytes_[position_] != 0) return fail("the padding is not zero");
      ++position_;
    }
    return true;
  }

  // A number at its natural boundary.
  template <typename Number>
  bool read(Number& number) {
    if (!align(sizeof number)) return false;
    if (limit_ - position_ < sizeof number) return fail(kEndsTooEarly);
    Bits<sizeof number> bits;
    std::memcpy(&bits, bytes_ + position_, sizeof bits);
    if (swapped_) bits = swapBytes(bits);
    std::memcpy(&number, &bits, sizeof number);
    position_ += sizeof number;
    return true;
  }

  bool readBoolean(bool& boolean);
  bool readText(std::string_view& text) {
    if (!readUncheckedText(text)) return false;
    return isUtf8WithoutNul(text) || fail("text that is not UTF-8 or has a NUL in it");
  }
  // A text whose characters the caller checks by a stricter rule.
  bool readUncheckedText(std::string_view& text) {
    std::uint32_t length = 0;
    return read(length) && takeTerminated(length, text);
  }
  bool readPath(std::string_view& path);
  bool readSignature(std::string_view& signature);
  // The signature of a variant, whose grammar is not looked at.
  bool readVariantSignature(std::string_view& signature) {
    std::uint8_t length = 0;
    return read(length) && takeTerminated(length, signature);
  }

  // Reads the length of an array of elements with that alignment and goes to the first of them.
  // Until leaveArray(), nothing can be read past the end of the array.
  bool enterArray(std::size_t elementAlignment, std::size_t& outerLimit);
  void leaveArray(std::size_t outerLimit) { limit_ = outerLimit; }
  // All that is left of the array.
  std::span<const std::byte> takeRest();

 private:
  static constexpr bool kHostIsBigEndian = __BYTE_ORDER__ == __ORDER_BIG_ENDIAN__;
  static constexpr std::string_view kEndsTooEarly = "the bytes end within it";

  template <std::size_t kSize>
  struct BitsOfSize;
  template <std::size_t kSize>
  using Bits = typename BitsOfSize<kSize>::Type;

  static std::uint8_t swapBytes(std::uint8_t bits) { return bits; }
  static std::uint16_t swapBytes(std::uint16_t bits) { return __builtin_bswap16(bits); }
  static std::uint32_t swapBytes(std::uint32_t bits) { return __builtin_bswap32(bits); }
  static std::uint64_t swapBytes(std::uint64_t bits) { return __builtin_bswap64(bits); }

  bool takeTerminated(std::size_t length, std::string_view& text) {
    if (limit_ - position_ <= length) return fail(kEndsTooEarly);
    if (bytes_[position_ + length] != '\0') return fail("its end is not marked by a NUL");
    text = {bytes_ + position_, length};
    position_ += length + 1;
    return true;
  }

  const char* bytes_;
  std::size_t position_ = 0;
  std::size_t limit_;
  bool swapped_;
  std::string_view problem_;
};

template <>
struct WireReader::BitsOfSize<1> {
  using Type = std::uint8_t;
};
template <>
struct WireReader::BitsOfSize<2> {
  using Type = std::uint16_t;
};
template <>
struct WireReader::BitsOfSize<4> {
  using Type = std::uint32_t;
};
template <>
struct WireReader::BitsOfSize<8> {
  using Type = std::uint64_t;
};

}  // namespace halvox::platform::linux_::dbus
