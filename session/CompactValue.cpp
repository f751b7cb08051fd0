#include "session/CompactValue.h"

#include <bit>
#include <utility>

namespace halvox {
namespace {

using platform::Array;
using platform::Data;
using platform::Date;
using platform::Dictionary;
using platform::NumberKind;
using platform::Value;
using platform::ValueKind;

// The low four bits of a value's first byte. The high four bits hold the NumberKind of an integer,
// or the number of zero bytes that are omitted from a difference.
enum Tag : std::uint8_t {
  kNone,
  kInteger,
  // A difference of bits without its highest bytes, which are zero. Close time stamps differ by
  // such numbers.
  kFloat,
  kDouble,
  kDate,
  // A difference of bits without its lowest bytes, which are zero for short fractions.
  kFloatShiftedUp,
  kDoubleShiftedUp,
  kDateShiftedUp,
  kString,
  kData,
  kArray,
  kDictionary,
};

constexpr unsigned kTagBits = 4;
constexpr unsigned kBitsOfByte = 8;
constexpr unsigned kBytesOfBits = 8;
constexpr std::uint64_t kByteMask = 0xFF;
// The deepest nesting of containers that is read, because damaged bytes could otherwise exhaust the
// stack. A client's message never comes near it: the wire allows far fewer levels.
constexpr unsigned kMaxDepth = 256;
constexpr unsigned kToShiftedUp = kFloatShiftedUp - kFloat;

bool isSigned(NumberKind kind) {
  return kind == NumberKind::kInt16 || kind == NumberKind::kInt32 || kind == NumberKind::kInt64;
}

bool isFloating(NumberKind kind) {
  return kind == NumberKind::kFloat || kind == NumberKind::kDouble;
}

std::uint64_t integerOf(const Value& value, NumberKind kind) {
  return isSigned(kind) ? static_cast<std::uint64_t>(value.toInt64()) : value.toUInt64();
}

// The number that a difference is taken from: the previous number if it has the same type, else 0.
std::uint64_t integerBefore(const Value& previous, NumberKind kind) {
  return previous.isNumber() && previous.numberKind() == kind ? integerOf(previous, kind) : 0;
}

std::uint64_t bitsBefore(const Value& previous) {
  if (previous.kind() == ValueKind::kDate) {
    return std::bit_cast<std::uint64_t>(previous.date().secondsSince1970);
  }
  const bool isOne = previous.isNumber() && isFloating(previous.numberKind());
  return isOne ? std::bit_cast<std::uint64_t>(previous.toDouble()) : 0;
}

// Puts the sign into the lowest bit, because small negative differences are then short too. All
// arithmetic wraps around, and therefore any two numbers have a difference.
std::uint64_t zigzag(std::uint64_t difference) {
  const std::uint64_t sign = (difference >> 63U) != 0 ? ~std::uint64_t{0} : 0;
  return (difference << 1U) ^ sign;
}

std::uint64_t unzigzag(std::uint64_t number) {
  const std::uint64_t sign = (number & 1U) != 0 ? ~std::uint64_t{0} : 0;
  return (number >> 1U) ^ sign;
}

Value integer(NumberKind kind, std::uint64_t number) {
  switch (kind) {
    case NumberKind::kBool:
      return number != 0;
    case NumberKind::kUInt8:
      return static_cast<std::uint8_t>(number);
    case NumberKind::kInt16:
      return static_cast<std::int16_t>(number);
    case NumberKind::kUInt16:
      return static_cast<std::uint16_t>(number);
    case NumberKind::kInt32:
      return static_cast<std::int32_t>(number);
    case NumberKind::kUInt32:
      return static_cast<std::uint32_t>(number);
    case NumberKind::kInt64:
      return static_cast<std::int64_t>(number);
    default:
      return number;
  }
}

std::span<const std::byte> bytesOf(std::string_view text) {
  return std::as_bytes(std::span(text.data(), text.size()));
}

std::string_view textOf(std::span<const std::byte> bytes) {
  return {reinterpret_cast<const char*>(bytes.data()), bytes.size()};
}

}  // namespace

void CompactWriter::append(std::uint64_t number) {
  constexpr std::uint64_t kMore = 0x80;
  while (number >= kMore) {
    appendByte(number | kMore);
    number >>= 7U;
  }
  appendByte(number);
}

void CompactWriter::append(std::string_view text) {
  append(std::uint64_t{text.size()});
  const auto bytes = bytesOf(text);
  bytes_.insert(bytes_.end(), bytes.begin(), bytes.end());
}

void CompactWriter::append(const Value& previous, const Value& value) {
  switch (value.kind()) {
    case ValueKind::kNone:
      return appendByte(kNone);
    case ValueKind::kNumber:
      return appendNumber(previous, value);
    case ValueKind::kString:
      appendByte(kString);
      return append(value.string());
    case ValueKind::kDate:
      return appendBits(kDate, std::bit_cast<std::uint64_t>(value.date().secondsSince1970) ^
                                   bitsBefore(previous));
    case ValueKind::kData: {
      appendByte(kData);
      const Data data = value.data();
      return append(textOf(data.bytes()));
    }
    case ValueKind::kArray:
      return appendArray(value.array());
    case ValueKind::kDictionary:
      appendByte(kDictionary);
      return append(value.dictionary());
  }
}

void CompactWriter::appendNumber(const Value& previous, const Value& value) {
  const NumberKind kind = value.numberKind();
  if (isFloating(kind)) {
    return appendBits(kind == NumberKind::kFloat ? kFloat : kDouble,
                      std::bit_cast<std::uint64_t>(value.toDouble()) ^ bitsBefore(previous));
  }
  appendByte(kInteger | static_cast<std::uint64_t>(kind) << kTagBits);
  append(zigzag(integerOf(value, kind) - integerBefore(previous, kind)));
}

void CompactWriter::appendBits(std::uint64_t tag, std::uint64_t difference) {
  const auto leading = static_cast<unsigned>(std::countl_zero(difference)) / kBitsOfByte;
  const auto trailing = static_cast<unsigned>(std::countr_zero(difference)) / kBitsOfByte;
  const bool isShiftedUp = trailing > leading;
  const unsigned leftOut = isShiftedUp ? trailing : leading;
  appendByte((isShiftedUp ? tag + kToShiftedUp : tag) | std::uint64_t{leftOut} << kTagBits);
  if (isShiftedUp && leftOut < kBytesOfBits) difference >>= leftOut * kBitsOfByte;
  for (unsigned written = leftOut; written < kBytesOfBits; ++written) {
    appendByte(difference & kByteMask);
    difference >>= kBitsOfByte;
  }
}

void CompactWriter::appendArray(const Array& array) {
  appendByte(kArray);
  append(std::uint64_t{array.size()});
  for (const Value& element : array) append(Value(), element);
}

void CompactWriter::append(const Dictionary& dictionary) {
  append(std::uint64_t{dictionary.size()});
  for (const Dictionary::Entry& entry : dictionary) {
    append(entry.key.text());
    append(Value(), entry.value);
  }
}

void CompactReader::giveUp() {
  isIntact_ = false;
  position_ = bytes_.size();
}

std::uint64_t CompactReader::number() {
  constexpr std::uint64_t kLowBits = 0x7F;
  constexpr unsigned kBits = 64;
  std::uint64_t number = 0;
  for (unsigned shift = 0; shift < kBits; shift += 7) {
    const std::uint64_t next = byte();
    number |= (next & kLowBits) << shift;
    if (next <= kLowBits) return number;
  }
  giveUp();
  return 0;
}

std::size_t CompactReader::count() {
  const std::uint64_t count = number();
  if (count <= bytes_.size() - position_) return count;
  giveUp();
  return 0;
}

std::span<const std::byte> CompactReader::bytes(std::size_t length) {
  if (length > bytes_.size() - position_) {
    giveUp();
    return {};
  }
  const auto taken = bytes_.subspan(position_, length);
  position_ += length;
  return taken;
}

std::string_view CompactReader::text() { return textOf(bytes(count())); }

Value CompactReader::value(const Value& previous) {
  const std::uint8_t first = byte();
  const unsigned extra = first >> kTagBits;
  const auto real = [&](bool isShiftedUp) {
    return std::bit_cast<double>(bits(extra, isShiftedUp) ^ bitsBefore(previous));
  };
  switch (first & ((1U << kTagBits) - 1)) {
    case kInteger: {
      const auto kind = static_cast<NumberKind>(extra);
      return integer(kind, integerBefore(previous, kind) + unzigzag(number()));
    }
    case kFloat:
      return static_cast<float>(real(false));
    case kFloatShiftedUp:
      return static_cast<float>(real(true));
    case kDouble:
      return real(false);
    case kDoubleShiftedUp:
      return real(true);
    case kDate:
      return Date{real(false)};
    case kDateShiftedUp:
      return Date{real(true)};
    case kString:
      return text();
    case kData:
      return Data(bytes(count()));
    case kArray:
      return array();
    case kDictionary:
      return dictionary();
    case kNone:
      return {};
    default:
      giveUp();
      return {};
  }
}

std::uint64_t CompactReader::bits(unsigned leftOut, bool isShiftedUp) {
  std::uint64_t difference = 0;
  for (unsigned read = 0; read + leftOut < kBytesOfBits; ++read) {
    difference |= std::uint64_t{byte()} << (read * kBitsOfByte);
  }
  return isShiftedUp && leftOut < kBytesOfBits ? difference << (leftOut * kBitsOfByte) : difference;
}

Array CompactReader::array() {
  if (++depth_ > kMaxDepth) giveUp();
  std::vector<Value> elements(count());
  for (Value& element : elements) element = value(Value());
  --depth_;
  return Array(elements);
}

Dictionary CompactReader::dictionary() {
  if (++depth_ > kMaxDepth) giveUp();
  const std::size_t size = count();
  Dictionary dictionary;
  dictionary.reserve(size);
  for (std::size_t entry = 0; entry < size; ++entry) {
    const platform::Key key(text());
    dictionary.set(key, value(Value()));
  }
  --depth_;
  return dictionary;
}

}  // namespace halvox
