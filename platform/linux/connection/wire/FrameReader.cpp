#include <array>
#include <cstring>
#include <optional>

#include "platform/linux/connection/wire/Frame.h"
#include "platform/linux/connection/wire/HeaderFields.h"
#include "platform/linux/connection/wire/Names.h"
#include "platform/linux/connection/wire/Signature.h"
#include "platform/linux/connection/wire/ValueSkipper.h"
#include "platform/linux/connection/wire/WireReader.h"

namespace halvox::platform::linux_::dbus {
namespace {

struct FieldRule {
  std::string_view name;
  char type;
};
// The fields that D-Bus defines. The index of a rule is the number of the field; 0 is invalid.
constexpr std::array<FieldRule, 10> kFieldRules{{{"", '\0'},
                                                 {"path", 'o'},
                                                 {"interface", 's'},
                                                 {"member", 's'},
                                                 {"error name", 's'},
                                                 {"reply serial", 'u'},
                                                 {"destination", 's'},
                                                 {"sender", 's'},
                                                 {"signature", 'g'},
                                                 {"number of file descriptors", 'u'}}};

constexpr unsigned fieldBit(HeaderField field) { return 1U << static_cast<unsigned>(field); }

// D-Bus reserves this path and this interface for use inside one process. They must not be sent.
constexpr std::string_view kLocalPath = "/org/freedesktop/DBus/Local";
constexpr std::string_view kLocalInterface = "org.freedesktop.DBus.Local";

std::uint8_t byteAt(std::span<const std::byte> bytes, std::size_t offset) {
  return std::to_integer<std::uint8_t>(bytes[offset]);
}

std::uint32_t numberAt(std::span<const std::byte> bytes, std::size_t offset, bool bigEndian) {
  std::uint32_t number = 0;
  WireReader reader(bytes.subspan(offset, sizeof number), bigEndian);
  static_cast<void>(reader.read(number));
  return number;
}

// Returns what is wrong with the first bytes of a frame, and sets `offset` to the place of the
// error. Returns an empty text if the bytes are valid.
std::string_view problemOfStart(std::span<const std::byte> bytes, std::size_t& offset) {
  offset = 0;
  if (!bytes.empty() && byteAt(bytes, 0) != 'l' && byteAt(bytes, 0) != 'B') {
    return "the byte order is neither 'l' nor 'B'";
  }
  offset = kTypeOffset;
  if (bytes.size() > kTypeOffset && byteAt(bytes, kTypeOffset) == 0) {
    return "the message type is 0";
  }
  offset = kVersionOffset;
  if (bytes.size() > kVersionOffset && byteAt(bytes, kVersionOffset) != kProtocolVersion) {
    return "the protocol version is not 1";
  }
  return {};
}

std::uint64_t roundedUp(std::uint64_t bytes) { return (bytes + 7) & ~std::uint64_t{7}; }

FrameMeasure broken(std::string message, std::size_t offset) {
  return {FrameMeasure::State::kBroken, 0, {std::move(message), offset}};
}

// Reads the array of header fields into a header.
class FieldReader {
 public:
  FieldReader(std::span<const std::byte> fields, bool bigEndian, MessageHeader& header)
      : reader_(fields, bigEndian), header_(header) {}

  // Returns false on an error. error() then returns the error.
  bool readAll() {
    while (!reader_.atLimit()) {
      if (!readField()) return false;
    }
    return checkRequired();
  }

  [[nodiscard]] WireError error() const {
    std::string message = "header field ";
    message += std::to_string(code_);
    if (code_ > 0 && code_ < kFieldRules.size()) {
      message.append(" (").append(kFieldRules[code_].name).append(")");
    }
    message.append(": ").append(reader_.problem());
    return {std::move(message), kFrameStartBytes + reader_.position()};
  }

 private:
  bool readField() {
    std::string_view type;
    if (!reader_.align(8) || !reader_.read(code_) || !reader_.readVariantSignature(type)) {
      return false;
    }
    if (code_ == 0) return reader_.fail("a field cannot have the number 0");
    // D-Bus may define more fields, and requires that readers ignore fields that they do not know.
    if (code_ >= kFieldRules.size()) return skipUnknown(type);
    if (type.size() != 1 || type.front() != kFieldRules[code_].type) {
      return reader_.fail("its type is not the one that D-Bus defines");
    }
    const unsigned bit = 1U << code_;
    // Refuse a field that occurs twice. If a message had two paths, a bus could check its policy
    // with the first one while the service acts on the second.
    if ((seen_ & bit) != 0) return reader_.fail("occurs twice");
    seen_ |= bit;
    return readKnown(static_cast<HeaderField>(code_));
  }

  bool skipUnknown(std::string_view type) {
    // A field with an unsupported type is skipped like any other field. A field with an invalid
    // type cannot be skipped, because its length is not known.
    const SignatureShape shape = shapeOfType(type);
    if (shape == SignatureShape::kBroken || shape == SignatureShape::kTooDeep) {
      return reader_.fail("its signature is invalid");
    }
    return skipValue(reader_, type);
  }

  bool readKnown(HeaderField field) {
    switch (field) {
      case HeaderField::kPath:
        return reader_.readPath(header_.path) &&
               (header_.path != kLocalPath ||
                reader_.fail("this path is reserved and must not be sent"));
      case HeaderField::kInterface:
        return readName(header_.interface, isInterfaceName) &&
               (header_.interface != kLocalInterface ||
                reader_.fail("this interface is reserved and must not be sent"));
      case HeaderField::kMember:
        return readName(header_.member, isMemberName);
      case HeaderField::kErrorName:
        return readName(header_.errorName, isInterfaceName);
      case HeaderField::kReplySerial:
        return reader_.read(header_.replySerial) &&
               (header_.replySerial != 0 || reader_.fail("must not be 0"));
      case HeaderField::kDestination:
        return readName(header_.destination, isBusName);
      case HeaderField::kSender:
        return readName(header_.sender, isBusName);
      case HeaderField::kSignature:
        return reader_.readSignature(header_.signature);
      case HeaderField::kUnixFds:
        // Only store the number here. The dispatcher refuses requests that have descriptors.
        return reader_.read(header_.unixFds);
    }
    return false;
  }

  // Does not check for UTF-8, because isValid() allows only ASCII characters. The check would read
  // every name a second time.
  bool readName(std::string_view& name, bool (*isValid)(std::string_view)) {
    return reader_.readUncheckedText(name) && (isValid(name) || reader_.fail("invalid name"));
  }

  bool checkRequired() {
    const unsigned missing = requiredFields() & ~seen_;
    if (missing == 0) return true;
    code_ = static_cast<std::uint8_t>(__builtin_ctz(missing));
    return reader_.fail("missing from a message of this type");
  }

  [[nodiscard]] unsigned requiredFields() const {
    switch (header_.type) {
      case MessageType::kMethodCall:
        return fieldBit(HeaderField::kPath) | fieldBit(HeaderField::kMember);
      case MessageType::kMethodReturn:
        return fieldBit(HeaderField::kReplySerial);
      case MessageType::kError:
        return fieldBit(HeaderField::kReplySerial) | fieldBit(HeaderField::kErrorName);
      case MessageType::kSignal:
        return fieldBit(HeaderField::kPath) | fieldBit(HeaderField::kInterface) |
               fieldBit(HeaderField::kMember);
    }
    // A message of an unknown type needs no fields, because the dispatcher ignores it.
    return 0;  // an unknown type
  }

  WireReader reader_;
  MessageHeader& header_;  // of the caller, which outlives this
  std::uint8_t code_ = 0;
  unsigned seen_ = 0;  // a bit for each known field
};

// Checks what follows the fields: padding and the body.
std::variant<Frame, WireError> finish(MessageHeader header, std::span<const std::byte> frame,
                                      std::size_t fieldsEnd) {
  const std::size_t bodyStart = roundedUp(fieldsEnd);
  for (std::size_t offset = fieldsEnd; offset < bodyStart; ++offset) {
    if (byteAt(frame, offset) != 0) {
      return WireError{"the padding after the header is not zero", offset};
    }
  }
  const std::span<const std::byte> body = frame.subspan(bodyStart);
  if (header.signature.empty() && !body.empty()) {
    return WireError{"the message has a body but no signature", bodyStart};
  }
  return Frame{header, body};
}

// Takes the fields from the cache if there is a cache and it has them. Otherwise reads the fields.
std::optional<WireError> readFields(std::span<const std::byte> fields, MessageHeader& header,
                                    HeaderCache* cache) {
  if (cache != nullptr) {
    if (const MessageHeader* known = cache->find(header.type, header.bigEndian, fields)) {
      const std::uint8_t flags = header.flags;
      const std::uint32_t serial = header.serial;
      header = *known;
      header.flags = flags;
      header.serial = serial;
      return std::nullopt;
    }
  }
  FieldReader reader(fields, header.bigEndian, header);
  if (!reader.readAll()) return reader.error();
  if (cache != nullptr) cache->note(header, fields);
  return std::nullopt;
}

std::variant<Frame, WireError> readWhole(std::span<const std::byte> frame, HeaderCache* cache) {
  const FrameMeasure measure = measureFrame(frame, kMaxMessageBytes);
  if (measure.state == FrameMeasure::State::kBroken) return measure.error;
  if (measure.state != FrameMeasure::State::kKnown || measure.totalBytes != frame.size()) {
    return WireError{"the frame has another size than its header says", frame.size()};
  }
  MessageHeader header;
  header.type = static_cast<MessageType>(byteAt(frame, kTypeOffset));
  header.flags = byteAt(frame, kFlagsOffset);
  header.bigEndian = byteAt(frame, 0) == 'B';
  header.serial = numberAt(frame, kSerialOffset, header.bigEndian);
  // D-Bus forbids the serial 0. A reply to it would have the reply serial 0, which means that the
  // field is absent.
  if (header.serial == 0) return WireError{"the serial number must not be 0", kSerialOffset};

  const std::size_t fieldsBytes = numberAt(frame, kFieldsLengthOffset, header.bigEndian);
  const auto fields = frame.subspan(kFrameStartBytes, fieldsBytes);
  if (auto error = readFields(fields, header, cache)) return *std::move(error);
  return finish(header, frame, kFrameStartBytes + fieldsBytes);
}

}  // namespace

FrameMeasure measureFrame(std::span<const std::byte> bytes, std::size_t maxFrameBytes) {
  std::size_t offset = 0;
  const std::string_view problem = problemOfStart(bytes, offset);
  // Check the first bytes even if the rest of the header is missing. A broken stream then ends at
  // once, not after the time limit of a message.
  if (!problem.empty()) return broken(std::string(problem), offset);
  if (bytes.size() < kFrameStartBytes) return {};

  const bool bigEndian = byteAt(bytes, 0) == 'B';
  // Add the lengths in 64 bits. In 32 bits the sum of two lengths could wrap around and look like
  // the size of a small frame.
  const std::uint64_t bodyBytes = numberAt(bytes, kBodyLengthOffset, bigEndian);
  const std::uint64_t fieldsBytes = numberAt(bytes, kFieldsLengthOffset, bigEndian);
  if (fieldsBytes > kMaxArrayBytes) {
    return broken("the header claims more than 64 MiB of fields", kFieldsLengthOffset);
  }
  const std::uint64_t total = roundedUp(kFrameStartBytes + fieldsBytes) + bodyBytes;
  // Check this limit separately from the caller's limit, because the error must name the limit that
  // was exceeded.
  if (total > kMaxMessageBytes) {
    return broken("the header claims a message of " + std::to_string(total) +
                      " bytes; the limit of D-Bus is " + std::to_string(kMaxMessageBytes),
                  kBodyLengthOffset);
  }
  if (total > maxFrameBytes) {
    return broken("the header claims a message of " + std::to_string(total) +
                      " bytes; the limit is " + std::to_string(maxFrameBytes),
                  kBodyLengthOffset);
  }
  return {FrameMeasure::State::kKnown, static_cast<std::size_t>(total), {}};
}

std::variant<Frame, WireError> readFrame(std::span<const std::byte> frame) {
  return readWhole(frame, nullptr);
}

std::variant<Frame, WireError> readFrame(std::span<const std::byte> frame, HeaderCache& cache) {
  return readWhole(frame, &cache);
}

const MessageHeader* HeaderCache::find(MessageType type, bool bigEndian,
                                       std::span<const std::byte> fields) const {
  const Slot& slot = slots_[indexOf(fields)];
  const std::string_view text(reinterpret_cast<const char*>(fields.data()), fields.size());
  const bool isSame =
      slot.header.type == type && slot.header.bigEndian == bigEndian && slot.fields == text;
  return isSame && !text.empty() ? &slot.header : nullptr;
}

void HeaderCache::note(const MessageHeader& header, std::span<const std::byte> fields) {
  if (fields.size() > kMostBytes) return;
  Slot& slot = slots_[indexOf(fields)];
  slot.fields.assign(reinterpret_cast<const char*>(fields.data()), fields.size());
  slot.header = header;
  // The texts in `header` point into the caller's bytes. Read the fields again from the copy in the
  // slot; this cannot fail, because the caller has read the same bytes without an error.
  MessageHeader& moved = slot.header;
  static_cast<void>(
      FieldReader(std::as_bytes(std::span(slot.fields)), header.bigEndian, moved).readAll());
}

}  // namespace halvox::platform::linux_::dbus
