#include "platform/linux/connection/wire/FrameWriter.h"

#include <array>

#include "platform/linux/connection/wire/Frame.h"
#include "platform/linux/connection/wire/HeaderFields.h"
#include "platform/linux/connection/wire/Names.h"
#include "platform/linux/connection/wire/ValueEncoder.h"

namespace halvox::platform::linux_::dbus {
namespace {

// Appends one frame: its header field by field, then the body. Unless finish() succeeds, the
// destructor removes everything again. The caller owns the buffer, which must outlive this.
class FrameBuilder {
 public:
  FrameBuilder(std::string& out, MessageType type, std::uint8_t flags, std::uint32_t serial)
      : out_(out), start_(out.size()), encoder_(out, start_) {
    const std::array<char, 4> first{'l', static_cast<char>(type), static_cast<char>(flags),
                                    kProtocolVersion};
    out_.append(first.data(), first.size());
    encoder_.appendNumber(std::uint32_t{0});
    // The two lengths around the serial are known only at the end. finish() replaces them.
    encoder_.appendNumber(serial);
    encoder_.appendNumber(std::uint32_t{0});
  }
  FrameBuilder(const FrameBuilder&) = delete;
  FrameBuilder& operator=(const FrameBuilder&) = delete;
  ~FrameBuilder() {
    if (!finished_) out_.resize(start_);
  }

  void addNumber(HeaderField field, std::uint32_t number) {
    beginField(field, "u");
    encoder_.appendNumber(number);
  }
  void addPath(std::string_view path) {
    beginField(HeaderField::kPath, "o");
    encoder_.appendText(path);
  }
  void addText(HeaderField field, std::string_view text) {
    if (text.empty()) return;
    beginField(field, "s");
    encoder_.appendText(text);
  }

  void addTarget(const CallTarget& target) {
    addPath(target.path);
    addText(HeaderField::kInterface, target.interface);
    addText(HeaderField::kMember, target.member);
    addText(HeaderField::kDestination, target.destination);
  }

  // Adds the last field, ends the header and appends the body.
  bool finish(std::string_view signature, std::span<const Value> values) {
    // An empty body needs no signature: without this field, D-Bus assumes an empty body.
    if (!signature.empty()) {
      beginField(HeaderField::kSignature, "g");
      encoder_.appendSignature(signature);
    }
    // Compute the length of the fields before the padding is appended. The padding belongs neither
    // to the fields nor to the body.
    encoder_.replaceLength(start_ + kFieldsLengthOffset, out_.size() - start_ - kFrameStartBytes);
    encoder_.align(8);
    const std::size_t bodyStart = out_.size();
    if (!encoder_.appendAll(signature, values)) return false;
    encoder_.replaceLength(start_ + kBodyLengthOffset, out_.size() - bodyStart);
    // replaceLength() truncates a length that does not fit into 32 bits. Such a frame is over this
    // limit and is removed again.
    finished_ = out_.size() - start_ <= kMaxMessageBytes;
    return finished_;
  }

 private:
  void beginField(HeaderField field, std::string_view type) {
    encoder_.align(8);
    encoder_.appendNumber(static_cast<std::uint8_t>(field));
    encoder_.appendSignature(type);
  }

  std::string& out_;
  std::size_t start_;
  ValueEncoder encoder_;
  bool finished_ = false;
};

bool isValid(const ReplyTo& replyTo, std::uint32_t serial) {
  return serial != 0 && replyTo.serial != 0 &&
         (replyTo.destination.empty() || isBusName(replyTo.destination));
}

bool isValid(const CallTarget& target, std::uint32_t serial) {
  return serial != 0 && (target.destination.empty() || isBusName(target.destination)) &&
         (target.interface.empty() || isInterfaceName(target.interface)) &&
         isObjectPath(target.path) && isMemberName(target.member);
}

// Nearly all replies have no value or a boolean, and go to a client without a bus name. The frames
// of such replies differ in at most three numbers: two serials and the value. Each is therefore a
// copy of a constant, in which these numbers are then replaced.
constexpr std::string_view kPlainReply(
    "l\2\1\1"    // kMethodReturn, kNoReplyExpected, kProtocolVersion
    "\0\0\0\0"   // no body
    "\0\0\0\0"   // serial
    "\10\0\0\0"  // bytes of fields
    "\5\1u\0"    // kReplySerial of type "u"
    "\0\0\0\0",  // reply serial
    24);
constexpr std::string_view kBooleanReply(
    "l\2\1\1"
    "\4\0\0\0"   // a body of 4 bytes
    "\0\0\0\0"   // serial
    "\17\0\0\0"  // bytes of fields
    "\5\1u\0"
    "\0\0\0\0"         // reply serial
    "\10\1g\0\1b\0\0"  // kSignature of type "g": "b", and a byte of padding
    "\0\0\0\0",        // value
    36);
constexpr std::size_t kReplySerialOffset = 20;
constexpr std::size_t kBooleanOffset = 32;

void appendPlainReply(std::string& out, std::uint32_t replySerial, std::uint32_t serial) {
  const std::size_t start = out.size();
  out += kPlainReply;
  putLittleEndian(&out[start + kSerialOffset], serial);
  putLittleEndian(&out[start + kReplySerialOffset], replySerial);
}

void appendBooleanReply(std::string& out, std::uint32_t replySerial, std::uint32_t serial,
                        bool value) {
  const std::size_t start = out.size();
  out += kBooleanReply;
  putLittleEndian(&out[start + kSerialOffset], serial);
  putLittleEndian(&out[start + kReplySerialOffset], replySerial);
  out[start + kBooleanOffset] = value ? 1 : 0;
}

}  // namespace

bool appendMethodReturn(std::string& out, const ReplyTo& replyTo, std::uint32_t serial,
                        std::string_view signature, const Value& value) {
  // Check the arguments before appending anything, because after an error `out` must be unchanged.
  if (!isValid(replyTo, serial)) return false;
  if (replyTo.destination.empty() && signature.empty()) {
    appendPlainReply(out, replyTo.serial, serial);
    return true;
  }
  if (replyTo.destination.empty() && signature == "b" && value.isNumber()) {
    appendBooleanReply(out, replyTo.serial, serial, value.toBool());
    return true;
  }
  FrameBuilder frame(out, MessageType::kMethodReturn, kNoReplyExpected, serial);
  frame.addNumber(HeaderField::kReplySerial, replyTo.serial);
  frame.addText(HeaderField::kDestination, replyTo.destination);
  return frame.finish(signature, std::span(&value, signature.empty() ? 0 : 1));
}

bool appendError(std::string& out, const ReplyTo& replyTo, std::uint32_t serial,
                 std::string_view errorName, std::string_view message) {
  if (!isValid(replyTo, serial) || !isInterfaceName(errorName)) return false;
  FrameBuilder frame(out, MessageType::kError, kNoReplyExpected, serial);
  frame.addText(HeaderField::kErrorName, errorName);
  frame.addNumber(HeaderField::kReplySerial, replyTo.serial);
  frame.addText(HeaderField::kDestination, replyTo.destination);
  const Value text(message);
  return frame.finish("s", std::span(&text, 1));
}

bool appendMethodCall(std::string& out, std::uint32_t serial, const CallTarget& target,
                      std::string_view signature, std::span<const Value> arguments) {
  if (!isValid(target, serial)) return false;
  FrameBuilder frame(out, MessageType::kMethodCall, 0, serial);
  frame.addTarget(target);
  return frame.finish(signature, arguments);
}

bool appendSignal(std::string& out, std::uint32_t serial, const CallTarget& target,
                  std::string_view signature, std::span<const Value> arguments) {
  if (!isValid(target, serial) || target.interface.empty()) return false;
  FrameBuilder frame(out, MessageType::kSignal, kNoReplyExpected, serial);
  frame.addTarget(target);
  return frame.finish(signature, arguments);
}

}  // namespace halvox::platform::linux_::dbus
