#include "platform/protobuf.h"

#include <algorithm>
#include <array>

namespace halvox::platform {
namespace {

constexpr unsigned kWireTypeBits = 3;
constexpr unsigned kMaximumVarintBytes = 10;  // 64 bits, seven to a byte
constexpr unsigned kVarintBitsPerByte = 7;
constexpr std::uint8_t kVarintContinues = 0x80;
// The reader recurses for each nested group, and hostile bytes can open one more group with each
// byte. Without a bound they would overflow the stack. Real messages contain no groups.
constexpr unsigned kMaximumGroupDepth = 100;

void appendEscaped(std::string& text, char character) {
  switch (character) {
    case '\n':
      text += "\\n";
      return;
    case '\r':
      text += "\\r";
      return;
    case '\t':
      text += "\\t";
      return;
    case '"':
      text += "\\\"";
      return;
    case '\\':
      text += "\\\\";
      return;
    default:
      break;
  }
  const auto byte = static_cast<unsigned char>(character);
  if (byte >= 0x20 && byte < 0x7F) {
    text += character;
    return;
  }
  // Always write three octal digits, because a digit that follows must not be read as part of the
  // escape.
  text += '\\';
  for (const unsigned shift : {6U, 3U, 0U}) {
    text += static_cast<char>('0' + ((static_cast<unsigned>(byte) >> shift) & 7U));
  }
}

}  // namespace

// --- Reading ------------------------------------------------------------------------------------

bool ProtoReader::fail() {
  error_ = true;
  return false;
}

std::uint64_t ProtoReader::readVarint() {
  std::uint64_t value = 0;
  for (unsigned index = 0; index < kMaximumVarintBytes; ++index) {
    if (position_ >= bytes_.size()) {
      error_ = true;
      return 0;
    }
    const auto byte = std::to_integer<std::uint8_t>(bytes_[position_++]);
    value |= std::uint64_t{byte & 0x7FU} << (kVarintBitsPerByte * index);
    if ((byte & kVarintContinues) == 0) return value;
  }
  return 0;
}

ProtoReader::Tag ProtoReader::readTag() {
  // The field number is not checked, because an unknown field is skipped whatever its number.
  const std::uint64_t tag = readVarint();
  return {tag >> kWireTypeBits, static_cast<ProtoWireType>(tag & 7U)};
}

void ProtoReader::readString(std::string& value) {
  const std::uint64_t length = readVarint();
  if (error_) return;
  // Compare before adding, because `position_ + length` could overflow.
  if (length > bytes_.size() - position_) {
    error_ = true;
    return;
  }
  const auto bytes = bytes_.subspan(position_, static_cast<std::size_t>(length));
  value.resize(bytes.size());
  std::transform(bytes.begin(), bytes.end(), value.begin(),
                 [](std::byte byte) { return static_cast<char>(byte); });
  position_ += bytes.size();
}

bool ProtoReader::skipField(std::uint64_t number, ProtoWireType wireType) {
  return skipValue(number, wireType, 0);
}

bool ProtoReader::skipBytes(std::uint64_t count) {
  if (count > bytes_.size() - position_) return fail();
  position_ += static_cast<std::size_t>(count);
  return true;
}

// Recursive, with a bounded depth.
bool ProtoReader::skipValue(std::uint64_t number, ProtoWireType wireType, unsigned depth) {
  switch (wireType) {
    case ProtoWireType::kVarint:
      static_cast<void>(readVarint());
      return !error_;
    case ProtoWireType::kFixed64:
      return skipBytes(sizeof(std::uint64_t));
    case ProtoWireType::kLengthDelimited: {
      const std::uint64_t length = readVarint();
      return !error_ && skipBytes(length);
    }
    case ProtoWireType::kStartGroup:
      return skipGroup(number, depth + 1);
    case ProtoWireType::kFixed32:
      return skipBytes(sizeof(std::uint32_t));
    case ProtoWireType::kEndGroup:
      break;
  }
  return fail();  // an end without a start, or one of the two wire types without a meaning
}

// Recursive, with a bounded depth.
bool ProtoReader::skipGroup(std::uint64_t number, unsigned depth) {
  if (depth > kMaximumGroupDepth) return fail();
  for (;;) {
    const Tag tag = readTag();
    if (error_) return false;
    if (tag.wireType == ProtoWireType::kEndGroup) return tag.number == number || fail();
    if (!skipValue(tag.number, tag.wireType, depth)) return false;
  }
}

// --- Writing ------------------------------------------------------------------------------------

void ProtoWriter::writeUInt64(std::uint64_t value, std::uint32_t number) {
  writeTag(number, ProtoWireType::kVarint);
  writeVarint(value);
}

void ProtoWriter::writeInt32(std::int32_t value, std::uint32_t number) {
  writeUInt64(static_cast<std::uint64_t>(std::int64_t{value}), number);
}

void ProtoWriter::writeString(std::string_view value, std::uint32_t number) {
  writeTag(number, ProtoWireType::kLengthDelimited);
  writeVarint(value.size());
  const auto bytes = std::as_bytes(std::span(value));
  bytes_.insert(bytes_.end(), bytes.begin(), bytes.end());
}

void ProtoWriter::writeTag(std::uint32_t number, ProtoWireType wireType) {
  writeVarint(std::uint64_t{number} << kWireTypeBits | static_cast<std::uint64_t>(wireType));
}

void ProtoWriter::writeVarint(std::uint64_t value) {
  while (value >= kVarintContinues) {
    bytes_.push_back(static_cast<std::byte>(value | kVarintContinues));
    value >>= kVarintBitsPerByte;
  }
  bytes_.push_back(static_cast<std::byte>(value));
}

// --- Text ---------------------------------------------------------------------------------------

void ProtoTextFormatter::beginLine() { text_.append(depth_ * 2, ' '); }

void ProtoTextFormatter::beginObject(const char* name) {
  beginLine();
  if (name != nullptr) (text_ += name) += ' ';
  text_ += "{\n";
  ++depth_;
}

void ProtoTextFormatter::format(const char* name, std::int32_t value) {
  beginLine();
  ((text_ += name) += ": ") += std::to_string(value);
  text_ += '\n';
}

void ProtoTextFormatter::format(const char* name, std::uint64_t value) {
  beginLine();
  ((text_ += name) += ": ") += std::to_string(value);
  text_ += '\n';
}

void ProtoTextFormatter::format(const char* name, std::string_view value) {
  beginLine();
  (text_ += name) += ": \"";
  for (const char character : value) appendEscaped(text_, character);
  text_ += "\"\n";
}

void ProtoTextFormatter::endObject() {
  if (depth_ > 0) --depth_;
  beginLine();
  text_ += "}\n";
}

}  // namespace halvox::platform
