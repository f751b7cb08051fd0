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
// The largest number of arrays, structs and variants inside each other. A dictionary entry does not
// count as a level.
inline constexpr unsigned kMaxNesting = 64;

// The size of the fixed part of a header and the length of its field array. measureFrame() needs
// these bytes.
inline constexpr std::size_t kFrameStartBytes = 16;

// Flags of a header; other bits have no meaning and are ignored.
inline constexpr std::uint8_t kNoReplyExpected = 0x1;
inline constexpr std::uint8_t kNoAutoStart = 0x2;
inline constexpr std::uint8_t kAllowInteractiveAuthorization = 0x4;

// A frame may have a type that is not listed here. D-Bus requires that readers ignore such a frame.
enum class MessageType : std::uint8_t {
  kMethodCall = 1,
  kMethodReturn = 2,
  kError = 3,
  kSignal = 4,
};

[[nodiscard]] constexpr bool isKnown(MessageType type) {
  return type >= MessageType::kMethodCall && type <= MessageType::kSignal;
}

// The header of a message. If a field is absent, its text is empty or its number is 0. The texts
// point into the bytes from which the frame was read.
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

// One message in the read buffer. The buffer must outlive the frame. The body has not been checked.
struct Frame {
  MessageHeader header;
  std::span<const std::byte> body;
};

// The reason why bytes are not a valid message, in one line, and the offset of the error in the
// frame.
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

// Measures the frame at the start of `bytes`. Reports a frame of more than `maxFrameBytes` as
// broken as soon as its size is known, before its content has arrived.
[[nodiscard]] FrameMeasure measureFrame(std::span<const std::byte> bytes,
                                        std::size_t maxFrameBytes);

// Reads the header of one whole frame, which has the size that measureFrame() returned. Checks the
// types of the fields, the fields required for the type of message, names, paths, signatures,
// numbers and padding. Checks and skips fields with unknown numbers. Accepts messages of unknown
// types. After an error, the rest of the stream cannot be read. Allocates memory only for errors.
[[nodiscard]] std::variant<Frame, WireError> readFrame(std::span<const std::byte> frame);

// The headers of recently read frames. The calls of a client often differ only in their serial
// number. Fields that the cache has need not be read again; reading them is a twelfth of the work
// for a message. Belongs to one thread. Owned by the caller of readFrame().
class HeaderCache {
 public:
  HeaderCache() = default;
  HeaderCache(const HeaderCache&) = delete;
  HeaderCache& operator=(const HeaderCache&) = delete;

  // Returns the header that was read from equal fields, or null if the cache does not have it. Its
  // flags and serial number are those of the earlier frame. Its texts are valid until the next call
  // of note().
  [[nodiscard]] const MessageHeader* find(MessageType type, bool bigEndian,
                                          std::span<const std::byte> fields) const;
  // Stores a header that was read from `fields` without an error. Ignores long fields.
  void note(const MessageHeader& header, std::span<const std::byte> fields);

 private:
  struct Slot {
    std::string fields;
    MessageHeader header;  // its texts point into the fields
  };

  static constexpr std::size_t kSlots = 16;
  static constexpr std::size_t kMostBytes = 512;

  // The size of the fields chooses the slot, because different methods have names of different
  // lengths.
  [[nodiscard]] static std::size_t indexOf(std::span<const std::byte> fields) {
    return fields.size() % kSlots;
  }

  std::array<Slot, kSlots> slots_;
};

// Does the same as readFrame() without a cache, but faster. The texts of the header are valid until
// the next call with this cache.
[[nodiscard]] std::variant<Frame, WireError> readFrame(std::span<const std::byte> frame,
                                                       HeaderCache& cache);

}  // namespace halvox::platform::linux_::dbus
