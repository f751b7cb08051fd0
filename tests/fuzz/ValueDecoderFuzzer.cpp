// Feeds hostile bytes to the message decoder. The first byte selects how the others are used: as a
// whole frame, or as a body with a signature from a list, in either byte order.

#include <array>
#include <cstdint>
#include <cstdlib>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "platform/linux/base/Utf8.h"
#include "platform/linux/connection/wire/Frame.h"
#include "platform/linux/connection/wire/FrameWriter.h"
#include "platform/linux/connection/wire/ValueDecoder.h"

namespace halvox::platform::linux_::dbus {
namespace {

constexpr std::array<std::string_view, 15> kSignatures{
    "a{sv}uqaax", "a{sv}", "v",  "av",     "aav", "a{sa{sv}}", "ybnqiuxtdsog", "a(d)",
    "aay",        "as",    "qx", "a{sv}x", "aax", "a{say}",    "aaaaay"};

void require(bool condition) {
  if (!condition) std::abort();
}

// Decoded values may use this much more memory than their bytes on the wire. The worst case is a
// dictionary with one entry in some 16 bytes: the decoded dictionary has room for four entries.
constexpr std::size_t kMaxGrowth = 24;

// Everything that was decoded can be printed, and written and read again with the same result.
void checkValues(const Frame& frame, const std::vector<Value>& arguments) {
  std::size_t memory = 0;
  for (const Value& argument : arguments) {
    require(argument.kind() != ValueKind::kNone);
    memory += argument.memorySize();
    static_cast<void>(describe(argument));
  }
  require(memory <= kMaxGrowth * frame.body.size());

  std::string written;
  const CallTarget target{{}, "/o", {}, "m"};
  if (!appendMethodCall(written, 1, target, frame.header.signature, arguments)) {
    return;  // values nested almost to the limit can be read but not written
  }
  const auto again = readFrame(std::as_bytes(std::span(written)));
  require(std::holds_alternative<Frame>(again));
  std::vector<Value> decoded;
  require(!decodeBody(std::get<Frame>(again), frame.header.signature, decoded).has_value());
  require(decoded == arguments);
}

void checkError(const DecodeError& error) {
  require(!error.message.empty() && isUtf8WithoutNul(error.message));
  require(error.message.find('\n') == std::string::npos);
}

// What earlier inputs left in the caches must not change the result.
void checkCached(const Frame& frame, const std::optional<DecodeError>& expected,
                 const std::vector<Value>& values) {
  static DecodeScratch scratch{.caches = std::make_unique<DecodeCaches>()};
  std::vector<Value> arguments;
  const auto error = decodeBody(frame, frame.header.signature, arguments, scratch);
  require(error.has_value() == expected.has_value());
  require(!error.has_value() || error->message == expected->message);
  require(arguments == values);
}

void decode(const Frame& frame) {
  std::vector<Value> arguments;
  const auto error = decodeBody(frame, frame.header.signature, arguments);
  if (error.has_value()) {
    checkError(*error);
  } else {
    checkValues(frame, arguments);
  }
  checkCached(frame, error, arguments);
}

// What earlier inputs left in the caches must not change how a header is read either.
void checkCachedHeader(std::span<const std::byte> bytes,
                       const std::variant<Frame, WireError>& expected) {
  static HeaderCache cache;
  const auto result = readFrame(bytes, cache);
  require(result.index() == expected.index());
  if (const auto* error = std::get_if<WireError>(&result)) {
    const auto& other = std::get<WireError>(expected);
    require(error->message == other.message && error->offset == other.offset);
    return;
  }
  const MessageHeader& header = std::get<Frame>(result).header;
  const MessageHeader& other = std::get<Frame>(expected).header;
  require(header.type == other.type && header.flags == other.flags &&
          header.bigEndian == other.bigEndian && header.serial == other.serial &&
          header.replySerial == other.replySerial && header.unixFds == other.unixFds);
  require(header.path == other.path && header.interface == other.interface &&
          header.member == other.member && header.errorName == other.errorName &&
          header.destination == other.destination && header.sender == other.sender &&
          header.signature == other.signature);
  require(std::get<Frame>(result).body.data() == std::get<Frame>(expected).body.data());
}

void readWhole(std::span<const std::byte> bytes) {
  const auto result = readFrame(bytes);
  checkCachedHeader(bytes, result);
  if (const auto* frame = std::get_if<Frame>(&result)) {
    require(frame->body.size() <= bytes.size());
    decode(*frame);
  } else {
    require(!std::get<WireError>(result).message.empty());
  }
  const FrameMeasure measure = measureFrame(bytes, kMaxMessageBytes);
  // A frame with other bytes after it, as in a read buffer.
  if (measure.state == FrameMeasure::State::kKnown && measure.totalBytes < bytes.size()) {
    const auto first = readFrame(bytes.first(measure.totalBytes));
    if (const auto* frame = std::get_if<Frame>(&first)) decode(*frame);
  }
}

}  // namespace
}  // namespace halvox::platform::linux_::dbus

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace halvox::platform::linux_::dbus;
  if (size == 0) return 0;
  const std::uint8_t mode = data[0];
  // The rest is copied into a block of its own, so that sanitizers see its exact end.
  const std::vector<std::uint8_t> rest(data + 1, data + size);
  const auto bytes = std::as_bytes(std::span(rest));
  if (mode % 16 == kSignatures.size()) {
    readWhole(bytes);
    return 0;
  }
  Frame frame;
  frame.header.signature = kSignatures[mode % 16];
  frame.header.bigEndian = mode >= 128;
  frame.body = bytes;
  decode(frame);
  return 0;
}
