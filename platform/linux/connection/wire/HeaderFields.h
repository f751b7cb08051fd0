#pragma once

#include <cstddef>
#include <cstdint>

// The layout of a message header, shared by the reader and the writer.
namespace halvox::platform::linux_::dbus {

inline constexpr std::uint8_t kProtocolVersion = 1;

// Offsets in the fixed part of a header.
inline constexpr std::size_t kTypeOffset = 1;
inline constexpr std::size_t kFlagsOffset = 2;
inline constexpr std::size_t kVersionOffset = 3;
inline constexpr std::size_t kBodyLengthOffset = 4;
inline constexpr std::size_t kSerialOffset = 8;
inline constexpr std::size_t kFieldsLengthOffset = 12;

// The numbers of the fields that follow the fixed part.
enum class HeaderField : std::uint8_t {
  kPath = 1,
  kInterface = 2,
  kMember = 3,
  kErrorName = 4,
  kReplySerial = 5,
  kDestination = 6,
  kSender = 7,
  kSignature = 8,
  kUnixFds = 9,
};

inline void putLittleEndian(char* to, std::uint32_t number) {
  for (unsigned index = 0; index < sizeof number; ++index) {
    to[index] = static_cast<char>(number >> (8 * index));
  }
}

}  // namespace halvox::platform::linux_::dbus
