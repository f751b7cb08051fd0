#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/connection/wire/Frame.h"

namespace halvox::platform::linux_::dbus {

inline std::span<const std::byte> asBytes(std::string_view text) {
  return std::as_bytes(std::span(text.data(), text.size()));
}

inline std::string fromHex(std::string_view hex) {
  std::string bytes;
  for (std::size_t index = 0; index + 1 < hex.size(); index += 2) {
    bytes += static_cast<char>(std::stoi(std::string(hex.substr(index, 2)), nullptr, 16));
  }
  return bytes;
}

// Writes values in wire format one by one, and lets tests break any rule. Shares no code with the
// encoder, because tests must not trust the code under test.
class WireBytes {
 public:
  explicit WireBytes(bool bigEndian = false) : bigEndian_(bigEndian) {}

  WireBytes& align(std::size_t alignment) {
    while (bytes_.size() % alignment != 0) bytes_ += '\0';
    return *this;
  }
  template <typename Number>
  WireBytes& number(Number value) {
    align(sizeof value);
    char raw[sizeof value];
    std::memcpy(raw, &value, sizeof value);
    if (bigEndian_ != (std::endian::native == std::endian::big)) {
      for (std::size_t i = sizeof raw; i > 0; --i) bytes_ += raw[i - 1];
    } else {
      bytes_.append(raw, sizeof raw);
    }
    return *this;
  }
  WireBytes& u8(std::uint8_t value) { return number(value); }
  WireBytes& u16(std::uint16_t value) { return number(value); }
  WireBytes& u32(std::uint32_t value) { return number(value); }
  WireBytes& u64(std::uint64_t value) { return number(value); }
  WireBytes& real(double value) { return number(value); }
  WireBytes& raw(std::string_view bytes) {
    bytes_ += bytes;
    return *this;
  }
  WireBytes& text(std::string_view value) {
    u32(static_cast<std::uint32_t>(value.size())).raw(value);
    return raw(std::string_view("\0", 1));
  }
  WireBytes& signature(std::string_view value) {
    u8(static_cast<std::uint8_t>(value.size())).raw(value);
    return raw(std::string_view("\0", 1));
  }
  // Appends an array. Its length is that of `content`, which starts at the next multiple of
  // `alignment`.
  WireBytes& array(std::size_t alignment, std::string_view content) {
    return u32(static_cast<std::uint32_t>(content.size())).align(alignment).raw(content);
  }

  [[nodiscard]] const std::string& bytes() const { return bytes_; }
  [[nodiscard]] bool bigEndian() const { return bigEndian_; }

 private:
  bool bigEndian_;
  std::string bytes_;
};

// The header of a whole message. The test writes the header fields itself.
inline std::string frameOf(std::uint8_t type, const WireBytes& fields, std::string_view body,
                           std::uint32_t serial = 1) {
  WireBytes frame(fields.bigEndian());
  frame.raw(fields.bigEndian() ? "B" : "l").u8(type).u8(0).u8(1);
  frame.u32(static_cast<std::uint32_t>(body.size())).u32(serial);
  return frame.array(8, fields.bytes()).align(8).raw(body).bytes();
}

// The fields of a call of method m of the object at /o.
inline WireBytes callFields(std::string_view signature, bool bigEndian = false) {
  WireBytes fields(bigEndian);
  fields.align(8).u8(1).signature("o").text("/o");
  fields.align(8).u8(3).signature("s").text("m");
  if (!signature.empty()) fields.align(8).u8(8).signature("g").signature(signature);
  return fields;
}

inline std::string callWith(std::string_view signature, const WireBytes& body) {
  return frameOf(1, callFields(signature, body.bigEndian()), body.bytes());
}

// Returns a frame that has only a signature and a body, for tests of the body alone.
inline Frame bodyFrame(std::string_view signature, const WireBytes& body) {
  Frame frame;
  frame.header.signature = signature;
  frame.header.bigEndian = body.bigEndian();
  frame.body = asBytes(body.bytes());
  return frame;
}

}  // namespace halvox::platform::linux_::dbus
