#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <variant>

namespace halvox::platform::linux_::dbus {

// Limits of D-Bus. Connections set a lower limit for frames.
inline constexpr std::size_t kMaxMessageBytes = std::size_t{128} * 1024 * 1024;
inline constexpr std::size_t kMaxArrayBytes = std::size_t{64} * 1024 * 1024;
// The most levels of arrays, structs and variants inside each other. A dictionary entry does not
// count as a level.
inline constexpr unsigned kMaxNesting = 64;

// The fixed part of a header and the length of its field array: what measureFrame() needs.
inline constexpr std::size_t kFrameStartBytes = 16;

// Flags of a header; other bits have no meaning and are ignored.
inline constexpr std::uint8_t kNoReplyExpected = 0x1;
inline constexpr std::uint8_t kNoAutoStart = 0x2;
inline constexpr std::uint8_t kAllowInteractiveAuthorization = 0x4;

// A frame may have a type that is not listed here. D-Bus requires that such a frame is ignored
// (isKnown()).
enum class MessageType : std::uint8_t {
  kMethodCall = 1,
  kMethodReturn = 2,
  kError = 3,
  kSignal = 4,
};

[[nodiscard]] constexpr bool isKnown(MessageType type) {
  return type >= MessageType::kMethodCall && type <= MessageType::kSignal;
}

// The header of a message. Texts are empty and numbers 0 if the field is absent. The texts point
// into the bytes that the frame was read from.
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

// One message in the read buffer, which must outlive it. The body has not been checked.
struct Frame {
  MessageHeader header;
  std::span<const std::byte> body;
};

// Why bytes are not a valid message: one line, and the offset of the error in the frame.
struct WireError {
  std::string message;
  std::size_t offset = 0;
};

// The size of a frame, computed from its first bytes.
struct FrameMeasure {
  enum class State : std::uint8_t {
    kNeedMoreBytes,  // fewer than kFrameStartBytes are there, and these are valid so far
    kKnown,          // `totalBytes` is the size of the whole frame, of which more may be missing
    kBroken,         // not a valid frame, or over the limit; `error` says why
  };
  State state = State::kNeedMoreBytes;
  std::size_t totalBytes = 0;
  WireError error;
};

// Measures the frame that starts at the first of `bytes`. A frame of more than `maxFrameBytes` is
// reported as broken as soon as its size is known, before its content has arrived.
[[nodiscard]] FrameMeasure measureFrame(std::span<const std::byte> bytes,
                                        std::size_t maxFrameBytes);

// Reads and checks the header of one whole frame, of the size that measureFrame() returned: the
// types of fields, the fields required for the type of message, names, paths, signatures, numbers
// and padding. Checks and skips fields with unknown numbers. Accepts messages of unknown types.
// After an error, the rest of the stream cannot be read. Allocates memory only for errors.
[[nodiscard]] std::variant<Frame, WireError> readFrame(std::span<const std::byte> frame);

// The headers of recently read frames. The calls of a client often differ only in their serial
// number. A header whose fields are known need not be read again: reading it is a twelfth of the
// work for a message. Belongs to one thread. Owned by the caller of readFrame().
class HeaderCache {
 public:
  HeaderCache() = default;
  HeaderCache(const HeaderCache&) = delete;
  HeaderCache& operator=(const HeaderCache&) = delete;

  // The header with these fields, without flags and serial number; null if it is not known. Its
  // texts are valid until the next call of note().
  [[nodiscard]] const MessageHeader* find(MessageType type, bool bigEndian,
                                          std::span<const std::byte> fields) const;
  // Keeps a header that was read from these fields without an error. Ignores long ones.
  void note(const MessageHeader& header, std::span<const std::byte> fields);

 private:
  struct Slot {
    std::string fields;
    MessageHeader header;  // its texts point into the fields
  };

  static constexpr std::size_t kSlots = 16;
  static constexpr std::size_t kMostBytes = 512;

  // Different methods have names of different lengths.
  [[nodiscard]] static std::size_t indexOf(std::span<const std::byte> fields) {
    return fields.size() % kSlots;
  }

  std::array<Slot, kSlots> slots_;
};

// Does the same as the function above. The texts of the header are valid until the next call with
// this cache.
[[nodiscard]] std::variant<Frame, WireError> readFrame(std::span<const std::byte> frame,
                                                       HeaderCache& cache);

}  // namespace halvox::platform::linux_::dbus
