#include "platform/linux/connection/wire/ValueEncoder.h"

#include <algorithm>
#include <cstdint>
#include <limits>

#include "platform/linux/base/Utf8.h"
#include "platform/linux/connection/wire/Frame.h"
#include "platform/linux/connection/wire/HeaderFields.h"
#include "platform/linux/connection/wire/Names.h"
#include "platform/linux/connection/wire/Signature.h"

namespace halvox::platform::linux_::dbus {
namespace {

// Arrays nested deeper than this are written as arrays of variants. The search for a common type of
// an array's elements visits each element once for each array around it. This limit bounds the
// effort.
constexpr unsigned kMaxUniformNesting = 8;

template <typename Number>
Number nearest(const Value& value) {
  using Limits = std::numeric_limits<Number>;
  if constexpr (Limits::is_signed) {
    return static_cast<Number>(
        std::clamp<std::int64_t>(value.toInt64(), Limits::min(), Limits::max()));
  } else {
    return static_cast<Number>(std::min<std::uint64_t>(value.toUInt64(), Limits::max()));
  }
}

char naturalCode(NumberKind kind) {
  switch (kind) {
    case NumberKind::kBool:
      return 'b';
    case NumberKind::kUInt8:
      return 'y';
    case NumberKind::kInt16:
      return 'n';
    case NumberKind::kUInt16:
      return 'q';
    case NumberKind::kInt32:
      return 'i';
    case NumberKind::kUInt32:
      return 'u';
    case NumberKind::kInt64:
      return 'x';
    case NumberKind::kUInt64:
      return 't';
    // D-Bus has no floating-point type of 32 bits. A float becomes a double.
    case NumberKind::kFloat:
    case NumberKind::kDouble:
      return 'd';
  }
  return '\0';
}

std::string naturalType(const Value& value, unsigned arrays);

// Returns the type of an array: that of its elements after an `a` if they all have one type, and
// `av` otherwise.
std::string naturalArrayType(const Array& array, unsigned arrays) {
  // An empty array has no element that could give it a type.
  if (array.empty() || arrays > kMaxUniformNesting) return "av";
  const std::string first = naturalType(array[0], arrays);
  const bool uniform = std::all_of(array.begin() + 1, array.end(), [&](const Value& element) {
    return naturalType(element, arrays) == first;
  });
  return uniform && !first.empty() ? "a" + first : "av";
}

// Returns the type of a value in a variant; empty for the absent value. `arrays` is the number of
// arrays around the value.
std::string naturalType(const Value& value, unsigned arrays) {
  switch (value.kind()) {
    case ValueKind::kNone:
      return {};
    case ValueKind::kNumber:
      return {naturalCode(value.numberKind())};
    case ValueKind::kString:
      return "s";
    case ValueKind::kDate:
      return "(d)";
    case ValueKind::kData:
      return "ay";
    case ValueKind::kArray:
      return naturalArrayType(value.array(), arrays + 1);
    case ValueKind::kDictionary:
      return "a{sv}";
  }
  return {};
}

}  // namespace

bool ValueEncoder::appendAll(std::string_view signature, std::span<const Value> values) {
  if (shapeOfSignature(signature) != SignatureShape::kTaken) return false;
  for (const Value& value : values) {
    if (signature.empty()) return false;
    const std::size_t length = firstTypeLength(signature);
    if (!append(signature.substr(0, length), value, 0)) return false;
    signature.remove_prefix(length);
  }
  return signature.empty();
}

void ValueEncoder::align(std::size_t alignment) {
  const std::size_t misaligned = (out_.size() - start_) % alignment;
  if (misaligned != 0) out_.append(alignment - misaligned, '\0');
}

void ValueEncoder::appendText(std::string_view text) {
  appendNumber(static_cast<std::uint32_t>(text.size()));
  out_ += text;
  out_ += '\0';
}

void ValueEncoder::appendSignature(std::string_view signature) {
  appendNumber(static_cast<std::uint8_t>(signature.size()));
  out_ += signature;
  out_ += '\0';
}

void ValueEncoder::replaceLength(std::size_t position, std::size_t length) {
  putLittleEndian(&out_[position], static_cast<std::uint32_t>(length));
}

bool ValueEncoder::append(std::string_view type, const Value& value, unsigned level) {
  switch (type.front()) {
    case 's':
    case 'o':
    case 'g':
      return value.isString() && appendStringAs(type.front(), value);
    case 'a':
    case 'v':
    case '(':
      return appendContainer(type, value, level + 1);
    default:
      return value.isNumber() && appendNumberAs(type.front(), value);
  }
}

bool ValueEncoder::appendNumberAs(char code, const Value& value) {
  switch (code) {
    case 'b':
      // D-Bus encodes a boolean in four bytes.
      appendNumber<std::uint32_t>(value.toBool() ? 1 : 0);
      return true;
    case 'y':
      appendNumber(nearest<std::uint8_t>(value));
      return true;
    case 'n':
      appendNumber(nearest<std::int16_t>(value));
      return true;
    case 'q':
      appendNumber(nearest<std::uint16_t>(value));
      return true;
    case 'i':
      appendNumber(nearest<std::int32_t>(value));
      return true;
    case 'u':
      appendNumber(nearest<std::uint32_t>(value));
      return true;
    case 'x':
      appendNumber(value.toInt64());
      return true;
    case 't':
      appendNumber(value.toUInt64());
      return true;
    case 'd':
      appendNumber(value.toDouble());
      return true;
    default:
      return false;
  }
}

bool ValueEncoder::appendStringAs(char code, const Value& value) {
  const std::string_view text = value.string();
  if (code == 'g') {
    if (!isSignature(text)) return false;
    appendSignature(text);
    return true;
  }
  // Check the length before appending the text, because the wire has only 32 bits for a length.
  if (text.size() > kMaxMessageBytes) return false;
  if (!(code == 'o' ? isObjectPath(text) : isUtf8WithoutNul(text))) return false;
  appendText(text);
  return true;
}

bool ValueEncoder::appendContainer(std::string_view type, const Value& value, unsigned level) {
  if (level > kMaxNesting) return false;
  if (type == "v") return appendVariant(value, level);
  if (type == "(d)") {
    if (value.kind() != ValueKind::kDate) return false;
    align(8);
    appendNumber(value.date().secondsSince1970);
    return true;
  }
  if (type.starts_with("a{")) {
    return value.isDictionary() && appendDictionary(type, value.dictionary(), level);
  }
  if (type == "ay" && value.kind() == ValueKind::kData) return appendData(value);
  return value.isArray() && appendArray(type, value.array(), level);
}

bool ValueEncoder::appendVariant(const Value& value, unsigned level) {
  const std::string type = naturalType(value, 0);
  if (type.empty()) return false;
  appendSignature(type);
  return append(type, value, level);
}

bool ValueEncoder::appendData(const Value& value) {
  const Data data = value.data();
  const auto bytes = data.bytes();
  if (bytes.size() > kMaxArrayBytes) return false;
  appendNumber(static_cast<std::uint32_t>(bytes.size()));
  out_.append(reinterpret_cast<const char*>(bytes.data()), bytes.size());
  return true;
}

bool ValueEncoder::appendArray(std::string_view type, const Array& array, unsigned level) {
  const std::string_view elementType = type.substr(1);
  std::size_t lengthPosition = 0;
  const std::size_t first = beginArray(alignmentOf(elementType.front()), lengthPosition);
  for (const Value& element : array) {
    if (!append(elementType, element, level)) return false;
  }
  return endArray(lengthPosition, first);
}

bool ValueEncoder::appendDictionary(std::string_view type, const Dictionary& dictionary,
                                    unsigned level) {
  const std::string_view valueType = type.substr(3, type.size() - 4);
  // Count the entry as a level although D-Bus does not. Some readers count it, and would refuse a
  // message that is nested deeper.
  const unsigned entryLevel = level + 1;
  if (entryLevel > kMaxNesting) return false;
  std::size_t lengthPosition = 0;
  const std::size_t first = beginArray(8, lengthPosition);
  for (const auto& [key, value] : dictionary) {
    if (!isUtf8WithoutNul(key.text())) return false;
    align(8);
    appendText(key.text());
    if (!append(valueType, value, entryLevel)) return false;
  }
  return endArray(lengthPosition, first);
}

std::size_t ValueEncoder::beginArray(std::size_t elementAlignment, std::size_t& lengthPosition) {
  align(sizeof(std::uint32_t));
  lengthPosition = out_.size();
  appendNumber(std::uint32_t{0});
  // Even an empty array has the padding before its first element. The array's length does not
  // include this padding.
  align(elementAlignment);
  return out_.size();
}

bool ValueEncoder::endArray(std::size_t lengthPosition, std::size_t firstElement) {
  const std::size_t length = out_.size() - firstElement;
  if (length > kMaxArrayBytes) return false;
  replaceLength(lengthPosition, length);
  return true;
}

}  // namespace halvox::platform::linux_::dbus
