#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <variant>

namespace halvox::platform::linux_::dbus {

// Limits that the wire itself sets. A connection sets tighter ones of its own.
inline constexpr std::size_t kMaxMessageBytes = std::size_t{128} * 1024 * 1024;
inline constexpr std::size_t kMaxArrayBytes = std::size_t{64} * 1024 * 1024;
// Arrays, structs and variants inside each other; the entries of a dictionary are no level.
inline constexpr unsigned kMaxNesting = 64;

// The fixed part of a header and the length of its field array: what measureFrame() needs.
inline constexpr std::size_t kFrameStartBytes = 16;

// Flags of a header; other bits have no meaning and are ignored.
inline constexpr std::uint8_t kNoReplyExpected = 0x1;
inline constexpr std::uint8_t kNoAutoStart = 0x2;
inline constexpr std::uint8_t kAllowInteractiveAuthorization = 0x4;

// A frame may carry a number that is none of these; such a frame is to be ignored (isKnown()).
enum class MessageType : std::uint8_t {
  kMethodCall = 1,
  kMethodReturn = 2,
  kError = 3,
  kSignal = 4,
};

[[nodiscard]] constexpr bool isKnown(MessageType type) {
  return type >= MessageType::kMethodCall && type <= MessageType::kSignal;
}

// What the header of a message says. Texts are empty and numbers 0 when the field is absent.
// The texts point into the bytes that the frame was read from.
struct MessageHeader {
  MessageType type = MessageType::kMethodCall;
  std::uint8_t flags = 0;
  bool bigEndian = false;
  std::uint32_t serial = 0;
  std::uint32_t replySerial = 0;
  std::string_view path;
  std::string_view interface;
  std::string_view member;
  std::string_view errorName;
  std::string_view destination;
  std::string_view sender;
  std::string_view signature;
  std::uint32_t unixFds = 0;
};

// One message as it lies in the read buffer, which must outlive it. The body is not looked at yet.
struct Frame {
  MessageHeader header;
  std::span<const std::byte> body;
};

// Why bytes are no message: one line, and the byte of the frame at which it shows.
struct WireError {
  std::string message;
  std::size_t offset = 0;
};

// What the first bytes of a frame tell about its size.
struct FrameMeasure {
  enum class State : std::uint8_t {
    kNeedMoreBytes,  // fewer than kFrameStartBytes are there, and nothing is wrong with them yet
    kKnown,          // `totalBytes` is the size of the whole frame, of which more may be missing
    kBroken,         // `error` says why this can be no frame, or none that is taken here
  };
  State state = State::kNeedMoreBytes;
  std::size_t totalBytes = 0;
  WireError error;
};

// Measures the frame that starts at the first of `bytes`. Frames of more than `maxFrameBytes` are
// broken before any of their content is there.
[[nodiscard]] FrameMeasure measureFrame(std::span<const std::byte> bytes,
                                        std::size_t maxFrameBytes);

// Reads and checks the header of one whole frame of the size that measureFrame() told: field types,
// the fields that the type of message must have, names, paths and signatures, numbers and padding.
// Fields of unknown numbers are checked and skipped. A message of unknown type is no error.
// After an error the stream makes no sense any more. Allocates nothing unless there is one.
[[nodiscard]] std::variant<Frame, WireError> readFrame(std::span<const std::byte> frame);

}  // namespace halvox::platform::linux_::dbus
