#pragma once

#include <cstddef>
#include <cstdint>
#include <cstring>
#include <span>
#include <string_view>

#include "platform/linux/base/Utf8.h"

namespace halvox::platform::linux_::dbus {

// Reads values of the basic types of the wire, one after the other, with all checks that concern a
// single value. The first byte must be at a multiple of 8 bytes in the message.
//
// Each read… function returns false if the bytes break a rule. `problem()` then says which rule,
// and the reader must not be used further. Texts point into the bytes, which the caller owns.
//
// The texts of problems are constants. The reader therefore allocates nothing, and hostile bytes
// cannot get into these texts.
class WireReader {
 public:
  WireReader(std::span<const std::byte> bytes, bool bigEndian)
      : bytes_(reinterpret_cast<const char*>(bytes.data())),
        limit_(bytes.size()),
        swapped_(bigEndian != kHostIsBigEndian) {}

  [[nodiscard]] std::size_t position() const { return position_; }
  [[nodiscard]] bool atLimit() const { return position_ == limit_; }
  [[nodiscard]] std::string_view problem() const { return problem_; }

  // True if the bytes are in the byte order of this machine.
  [[nodiscard]] bool isHostOrder() const { return !swapped_; }
  // rest() returns the bytes that remain of the array or message. skip() passes over some of them
  // without reading them.
  [[nodiscard]] std::string_view rest() const { return {bytes_ + position_, limit_ - position_}; }
  void skip(std::size_t bytes) { position_ += bytes; }

  // Stores the problem, and returns false.
  bool fail(std::string_view problem) {
    problem_ = problem;
    return false;
  }

  // Skips padding, which must be zero, up to the next multiple of `alignment`.
  bool align(std::size_t alignment) {
    const std::size_t aligned = (position_ + alignment - 1) & ~(alignment - 1);
    if (aligned > limit_) return fail(kEndsTooEarly);
    while (position_ < aligned) {
      if (bytes_[position_] != 0) return fail("the padding is not zero");
      ++position_;
    }
    return true;
  }

  // Skips padding, then reads a number. The alignment of a number is its size.
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
    return isUtf8WithoutNul(text) || fail("the text is not valid UTF-8 or contains a NUL");
  }
  // Reads a text without checking its characters. For callers that check the text by a stricter
  // rule.
  bool readUncheckedText(std::string_view& text) {
    std::uint32_t length = 0;
    return read(length) && takeTerminated(length, text);
  }
  bool readPath(std::string_view& path);
  bool readSignature(std::string_view& signature);
  // Reads the signature of a variant without checking its grammar.
  bool readVariantSignature(std::string_view& signature) {
    std::uint8_t length = 0;
    return read(length) && takeTerminated(length, signature);
  }

  // Reads the length of an array, and skips the padding before its first element. Until
  // leaveArray(), nothing can be read beyond the end of the array.
  bool enterArray(std::size_t elementAlignment, std::size_t& outerLimit);
  void leaveArray(std::size_t outerLimit) { limit_ = outerLimit; }
  // Reads and returns the remaining bytes of the array.
  std::span<const std::byte> takeRest();

 private:
  static constexpr bool kHostIsBigEndian = __BYTE_ORDER__ == __ORDER_BIG_ENDIAN__;
  static constexpr std::string_view kEndsTooEarly =
      "the value continues beyond the end of its container or of the message";

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
    if (bytes_[position_ + length] != '\0') return fail("the text does not end with a NUL");
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
