#include "platform/value.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <limits>

#include "platform/value_detail.h"

namespace halvox::platform {

using detail::ArrayRep;
using detail::DataRep;
using detail::DictionaryRep;
using detail::Reference;
using detail::StringRep;

namespace {

// Constants by the length of their text. A text with a length that no constant has costs one
// look-up; without the table, every decoded string would be compared with every constant.
constexpr std::size_t kMaxConstantLength = 64;
using ConstantTable = std::array<StringConstant*, kMaxConstantLength + 1>;

ConstantTable& constantTable() {
  static ConstantTable table{};
  return table;
}

// 2^63 and 2^64 are exact as doubles. The largest integers of 64 bits are not: they would be
// rounded up to these powers, and a comparison with them would let a conversion overflow.
constexpr double kTwoTo63 = 9223372036854775808.0;
constexpr double kTwoTo64 = 18446744073709551616.0;

bool equalIntegers(std::int64_t left, bool leftSigned, std::int64_t right, bool rightSigned) {
  if (left != right) return false;
  // Equal bits mean equal numbers, unless one side reads them as negative.
  return leftSigned == rightSigned || left >= 0;
}

// Converts the double to the integer's type, never the reverse, because an integer above 2^53 loses
// bits as a double and would equal its neighbours.
bool equalsDouble(std::int64_t bits, bool isSigned, double number) {
  if (isSigned) {
    return number >= -kTwoTo63 && number < kTwoTo63 && number == std::trunc(number) &&
           static_cast<std::int64_t>(number) == bits;
  }
  return number >= 0 && number < kTwoTo64 && number == std::trunc(number) &&
         static_cast<std::uint64_t>(number) == static_cast<std::uint64_t>(bits);
}

// A NaN equals every NaN (see Value).
bool equalDoubles(double left, double right) {
  return left == right || (std::isnan(left) && std::isnan(right));
}

bool isFloating(NumberKind kind) { return kind >= NumberKind::kFloat; }

bool isSigned(NumberKind kind) {
  return kind == NumberKind::kInt16 || kind == NumberKind::kInt32 || kind == NumberKind::kInt64;
}

}  // namespace

StringConstant::StringConstant(std::string_view text) : text_(text) {
  StringConstant*& head = constantTable().at(text.size());
  next_ = std::exchange(head, this);
}

// --- Value --------------------------------------------------------------------------------------

Value::Value(const StringConstant& constant) noexcept {
  setTag(Tag::kConstantString);
  setPayload(&constant);
}

const StringConstant* Value::constantWith(std::string_view text) {
  if (text.size() > kMaxConstantLength) return nullptr;
  const StringConstant* constant = constantTable()[text.size()];
  while (constant != nullptr && constant->text() != text) constant = constant->next_;
  return constant;
}

Value::Value(std::string_view text) {
  if (const StringConstant* const constant = constantWith(text)) {
    setTag(Tag::kConstantString);
    setPayload(constant);
    return;
  }
  if (text.size() <= kInlineCapacity) {
    setTag(Tag::kInlineString);
    storage_[1] = static_cast<unsigned char>(text.size());
    if (!text.empty()) std::memcpy(&storage_[2], text.data(), text.size());
    return;
  }
  void* memory = detail::allocateNode<StringRep>(text.size());
  auto* rep = new (memory) StringRep{{1}, static_cast<std::uint32_t>(text.size())};
  std::copy(text.begin(), text.end(), rep->text());
  setTag(Tag::kSharedString);
  setPayload(rep);
}

Value Value::lending(std::string_view text) {
  if (text.size() <= kInlineCapacity || constantWith(text) != nullptr) return text;
  Value value;
  value.lend(text.data(), text.size());
  return value;
}

void Value::lend(const char* text, std::size_t length) {
  setTag(Tag::kLentString);
  const auto size = static_cast<std::uint32_t>(length);
  std::memcpy(&storage_[4], &size, sizeof size);
  setPayload(text);
}

Value::Value(Date date) noexcept {
  setTag(Tag::kDate);
  setPayload(date.secondsSince1970);
}

Value::Value(Data data) noexcept {
  setTag(Tag::kData);
  setPayload(data.rep_.take());
}

Value::Value(Array array) noexcept {
  setTag(Tag::kArray);
  setPayload(array.rep_.take());
}

Value::Value(Dictionary dictionary) noexcept {
  setTag(Tag::kDictionary);
  const auto count = static_cast<std::uint32_t>(dictionary.size());
  std::memcpy(&storage_[4], &count, sizeof count);
  setPayload(dictionary.rep_.take());
}

// Allocates memory for a lent text. If there is none, the process ends.
void Value::onCopied() noexcept {
  if (!isLent()) return retain();
  const std::string_view text = string();
  setTag(Tag::kNone);
  *this = Value(text);
}

// The kind of node does not matter here, because every counted node begins with its reference
// count. An empty container has no node.
void Value::retain() const noexcept {
  if (auto* references = payload<detail::ReferenceCount*>()) detail::retain(*references);
}

void Value::release() noexcept {
  switch (tag()) {
    case Tag::kSharedString: {
      auto* rep = payload<StringRep*>();
      if (detail::releaseLast(rep->references)) {
        rep->~StringRep();
        ::operator delete(rep);
      }
      break;
    }
    case Tag::kData:
      if (auto* rep = payload<DataRep*>()) detail::release(*rep);
      break;
    case Tag::kArray:
      if (auto* rep = payload<ArrayRep*>()) detail::release(*rep);
      break;
    case Tag::kDictionary:
      if (auto* rep = payload<DictionaryRep*>()) detail::release(*rep);
      break;
    case Tag::kNone:
    case Tag::kFirstNumber:
    case Tag::kLastNumber:
    case Tag::kDate:
    case Tag::kInlineString:
    case Tag::kConstantString:
    case Tag::kLentString:
      break;
  }
  setTag(Tag::kNone);
}

void Value::setNumber(NumberKind kind, std::int64_t number) noexcept {
  storage_[0] = static_cast<unsigned char>(static_cast<unsigned>(Tag::kFirstNumber) +
                                           static_cast<unsigned>(kind));
  setPayload(number);
}

void Value::setNumber(NumberKind kind, std::uint64_t number) noexcept {
  setNumber(kind, static_cast<std::int64_t>(number));
}

void Value::setNumber(NumberKind kind, double number) noexcept {
  std::int64_t bits = 0;
  std::memcpy(&bits, &number, sizeof bits);
  setNumber(kind, bits);
}

std::int64_t Value::toInt64() const {
  if (!isNumber()) return 0;
  const NumberKind kind = numberKind();
  if (isFloating(kind)) {
    const auto number = payload<double>();
    if (std::isnan(number)) return 0;
    if (number >= kTwoTo63) return std::numeric_limits<std::int64_t>::max();
    if (number < -kTwoTo63) return std::numeric_limits<std::int64_t>::min();
    return static_cast<std::int64_t>(number);
  }
  const auto bits = payload<std::int64_t>();
  return bits < 0 && !isSigned(kind) ? std::numeric_limits<std::int64_t>::max() : bits;
}

std::uint64_t Value::toUInt64() const {
  if (!isNumber()) return 0;
  const NumberKind kind = numberKind();
  if (isFloating(kind)) {
    const auto number = payload<double>();
    if (!(number > 0)) return 0;  // false for a NaN, too
    if (number >= kTwoTo64) return std::numeric_limits<std::uint64_t>::max();
    return static_cast<std::uint64_t>(number);
  }
  const auto bits = payload<std::int64_t>();
  return bits < 0 && isSigned(kind) ? 0 : static_cast<std::uint64_t>(bits);
}

double Value::toDouble() const {
  if (!isNumber()) return 0;
  const NumberKind kind = numberKind();
  if (isFloating(kind)) return payload<double>();
  const auto bits = payload<std::int64_t>();
  return isSigned(kind) ? static_cast<double>(bits)
                        : static_cast<double>(static_cast<std::uint64_t>(bits));
}

bool Value::toBool() const { return toDouble() != 0; }

std::string_view Value::string() const {
  switch (tag()) {
    case Tag::kInlineString:
      return {reinterpret_cast<const char*>(&storage_[2]), storage_[1]};
    case Tag::kConstantString:
      return payload<const StringConstant*>()->text();
    case Tag::kLentString: {
      std::uint32_t length = 0;
      std::memcpy(&length, &storage_[4], sizeof length);
      return {payload<const char*>(), length};
    }
    case Tag::kSharedString: {
      auto* rep = payload<StringRep*>();
      return {rep->text(), rep->length};
    }
    default:  // the many tags that are not strings
      return {};
  }
}

bool Value::isIdenticalTo(const StringConstant& constant) const {
  return tag() == Tag::kConstantString && payload<const StringConstant*>() == &constant;
}

Date Value::date() const { return tag() == Tag::kDate ? Date{payload<double>()} : Date{}; }

Data Value::data() const {
  if (tag() != Tag::kData) return Data(std::span<const std::byte>{});
  retain();
  return Data(payload<DataRep*>());
}

Array Value::array() const {
  if (tag() != Tag::kArray) return {};
  retain();
  return Array(payload<ArrayRep*>());
}

Dictionary Value::dictionary() const {
  if (tag() != Tag::kDictionary) return {};
  retain();
  std::uint32_t count = 0;
  std::memcpy(&count, &storage_[4], sizeof count);
  return {payload<DictionaryRep*>(), count};
}

// Call only for a counted reference or a lent text. A lent text counts as if the value owned it,
// because it takes room in the dictionary that the value is in.
std::size_t Value::heapSize() const {
  switch (tag()) {
    case Tag::kLentString:
      return string().size();
    case Tag::kSharedString:
      return sizeof(StringRep) + payload<StringRep*>()->length;
    case Tag::kData: {
      auto* rep = payload<DataRep*>();
      return rep == nullptr ? 0 : sizeof(DataRep) + rep->length;
    }
    case Tag::kArray:
      return array().memorySize();
    case Tag::kDictionary:
      return dictionary().memorySize();
    default:  // kinds that are stored in the value itself
      return 0;
  }
}

bool Value::equalNumbers(const Value& left, const Value& right) {
  const NumberKind leftKind = left.numberKind();
  const NumberKind rightKind = right.numberKind();
  const auto leftBits = left.payload<std::int64_t>();
  const auto rightBits = right.payload<std::int64_t>();
  if (isFloating(leftKind) && isFloating(rightKind)) {
    return equalDoubles(left.payload<double>(), right.payload<double>());
  }
  if (isFloating(leftKind)) {
    return equalsDouble(rightBits, isSigned(rightKind), left.payload<double>());
  }
  if (isFloating(rightKind)) {
    return equalsDouble(leftBits, isSigned(leftKind), right.payload<double>());
  }
  return equalIntegers(leftBits, isSigned(leftKind), rightBits, isSigned(rightKind));
}

bool operator==(const Value& left, const Value& right) {
  const ValueKind kind = left.kind();
  if (kind != right.kind()) return false;
  switch (kind) {
    case ValueKind::kNone:
      return true;
    case ValueKind::kNumber:
      return Value::equalNumbers(left, right);
    case ValueKind::kString:
      return left.string() == right.string();
    case ValueKind::kDate:
      return equalDoubles(left.date().secondsSince1970, right.date().secondsSince1970);
    case ValueKind::kData:
      return left.data() == right.data();
    case ValueKind::kArray:
      return left.array() == right.array();
    case ValueKind::kDictionary:
      return left.dictionary() == right.dictionary();
  }
  return false;
}

// --- Data ---------------------------------------------------------------------------------------

void detail::retain(DataRep& node) noexcept { retain(node.references); }

void detail::release(DataRep& node) noexcept {
  if (!releaseLast(node.references)) return;
  node.~DataRep();
  ::operator delete(&node);
}

Data::Data(std::span<const std::byte> bytes) {
  if (bytes.empty()) return;
  void* memory = detail::allocateNode<DataRep>(bytes.size());
  rep_ = Reference(new (memory) DataRep{{1}, bytes.size()});
  std::copy(bytes.begin(), bytes.end(), rep_->bytes());
}

std::span<const std::byte> Data::bytes() const {
  return rep_ == nullptr ? std::span<const std::byte>{} : std::span(rep_->bytes(), rep_->length);
}

bool operator==(const Data& left, const Data& right) {
  return left.rep_ == right.rep_ || std::ranges::equal(left.bytes(), right.bytes());
}

// --- Array --------------------------------------------------------------------------------------

void detail::retain(ArrayRep& node) noexcept { retain(node.references); }

void detail::release(ArrayRep& node) noexcept {
  if (!releaseLast(node.references)) return;
  std::destroy_n(node.values(), node.count);
  node.~ArrayRep();
  ::operator delete(&node);
}

Array::Array(std::span<const Value> values) {
  if (values.empty()) return;
  void* memory = detail::allocateNode<ArrayRep>(values.size_bytes());
  rep_ = Reference(new (memory) ArrayRep{{1}, static_cast<std::uint32_t>(values.size())});
  std::uninitialized_copy(values.begin(), values.end(), rep_->values());
}

std::size_t Array::size() const { return rep_ == nullptr ? 0 : rep_->count; }
const Value* Array::begin() const { return rep_ == nullptr ? nullptr : rep_->values(); }

std::size_t Array::memorySize() const {
  if (rep_ == nullptr) return 0;
  std::size_t bytes = sizeof(ArrayRep) + rep_->count * sizeof(Value);
  for (const Value& value : *this) bytes += value.memorySize();
  return bytes;
}

bool operator==(const Array& left, const Array& right) {
  return left.rep_ == right.rep_ || std::ranges::equal(left, right);
}

}  // namespace halvox::platform
