#include "platform/linux/store/PayloadEncoder.h"

#include <algorithm>
#include <array>
#include <bit>
#include <charconv>
#include <chrono>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <cstring>
#include <span>
#include <string>

#include <rapidjson/stringbuffer.h>
#include <rapidjson/writer.h>

#include "platform/linux/base/Utf8.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::size_t kKeptBufferBytes = 256 * 1024;
// No number is longer: the shortest form of a double has at most 24 characters, and an integer of
// 64 bits at most 20.
constexpr std::size_t kLongestNumber = 32;

// The range of dates that are written as RFC 3339, which has four digits for the year. Both bounds
// are in seconds since 1970.
constexpr double kEarliest = -62135596800.0;  // 0001-01-01
constexpr double kEnd = 253402300800.0;       // 10000-01-01

enum class TextKind : std::uint8_t { kPlain, kEscapesNeeded, kNotAscii };

// Tests eight bytes at a time. Nearly all texts are plain, and a plain text is copied without
// further tests.
TextKind classify(std::string_view text) {
  constexpr std::uint64_t kOnes = 0x0101010101010101U;
  constexpr std::uint64_t kHighs = kOnes * 0x80U;
  std::uint64_t special = 0;
  std::uint64_t high = 0;
  const auto look = [&](std::uint64_t word) {
    const std::uint64_t quotes = word ^ (kOnes * '"');
    const std::uint64_t backslashes = word ^ (kOnes * '\\');
    high |= word;
    // The three lines set the high bit of each byte that is below 0x20, a quote or a backslash. The
    // borrow of a subtraction may also mark the byte above such a byte. This does no harm, because
    // it only matters whether any byte is marked.
    special |= (word - kOnes * 0x20U) & ~word;
    special |= (quotes - kOnes) & ~quotes;
    special |= (backslashes - kOnes) & ~backslashes;
  };
  const char* at = text.data();
  std::size_t left = text.size();
  for (; left >= 8; at += 8, left -= 8) {
    std::uint64_t word = 0;
    std::memcpy(&word, at, 8);
    look(word);
  }
  if (left > 0) {
    std::uint64_t word = kOnes * 'a';
    std::memcpy(&word, at, left);
    look(word);
  }
  if ((high & kHighs) != 0) return TextKind::kNotAscii;
  return (special & kHighs) != 0 ? TextKind::kEscapesNeeded : TextKind::kPlain;
}

// Writes a date as "2023-11-14T22:13:20.250000Z" into `buffer`.
std::string_view dateText(double secondsSince1970, std::span<char, 64> buffer) {
  using namespace std::chrono;
  // Limit the result, because a date just before the end would be rounded up to the year 10000.
  // Round, because as a double a fraction such as .1 is often a little less.
  const auto rounded = microseconds{std::llround(secondsSince1970 * 1e6)};
  const sys_time<microseconds> time{
      std::min(rounded, duration_cast<microseconds>(duration<double>(kEnd)) - microseconds(1))};
  const auto day = floor<days>(time);
  const year_month_day calendar{day};
  const hh_mm_ss clock{time - day};
  const int length = std::snprintf(
      buffer.data(), buffer.size(), "%04d-%02u-%02uT%02d:%02d:%02d.%06dZ",
      static_cast<int>(calendar.year()), static_cast<unsigned>(calendar.month()),
      static_cast<unsigned>(calendar.day()), static_cast<int>(clock.hours().count()),
      static_cast<int>(clock.minutes().count()), static_cast<int>(clock.seconds().count()),
      static_cast<int>(clock.subseconds().count()));
  return {buffer.data(), static_cast<std::size_t>(length)};
}

std::string base64(std::span<const std::byte> bytes) {
  constexpr std::string_view kAlphabet =
      "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
  std::string text;
  text.reserve((bytes.size() + 2) / 3 * 4);
  for (std::size_t index = 0; index < bytes.size(); index += 3) {
    const auto group = bytes.subspan(index, std::min<std::size_t>(3, bytes.size() - index));
    std::uint32_t bits = 0;
    for (std::size_t at = 0; at < 3; ++at) {
      bits = bits << 8U | (at < group.size() ? std::to_integer<std::uint32_t>(group[at]) : 0U);
    }
    for (std::size_t at = 0; at < 4; ++at) {
      text += at <= group.size() ? kAlphabet[bits >> (18U - 6U * at) & 63U] : '=';
    }
  }
  return text;
}

bool alike(const Value& left, const Value& right);

bool alikeNumbers(const Value& left, const Value& right) {
  if (left.numberKind() != right.numberKind()) return false;
  switch (left.numberKind()) {
    case NumberKind::kFloat:
    case NumberKind::kDouble:
      // Compare the bits, because 0.0 and -0.0 are equal but have different texts.
      return std::bit_cast<std::uint64_t>(left.toDouble()) ==
             std::bit_cast<std::uint64_t>(right.toDouble());
    case NumberKind::kUInt64:
      return left.toUInt64() == right.toUInt64();
    case NumberKind::kBool:
    case NumberKind::kUInt8:
    case NumberKind::kInt16:
    case NumberKind::kUInt16:
    case NumberKind::kInt32:
    case NumberKind::kUInt32:
    case NumberKind::kInt64:
      return left.toInt64() == right.toInt64();
  }
  return false;
}

bool alike(const Value& left, const Value& right) {
  if (left.kind() != right.kind()) return false;
  switch (left.kind()) {
    case ValueKind::kNone:
      return true;
    case ValueKind::kNumber:
      return alikeNumbers(left, right);
    case ValueKind::kString:
      return left.string() == right.string();
    case ValueKind::kDate:
      return left.date() == right.date();
    case ValueKind::kData:
      return left.data() == right.data();
    case ValueKind::kArray:
      return std::ranges::equal(left.array(), right.array(), alike);
    case ValueKind::kDictionary:
      return encodeAlike(left.dictionary(), right.dictionary());
  }
  return false;
}

}  // namespace

// Extends RapidJSON's writer with faster code for plain texts and numbers, which RapidJSON writes
// one character at a time. Derives from the writer because its function Prefix(), which keeps track
// of commas and nesting, is protected.
class PayloadEncoder::Text : private rapidjson::Writer<rapidjson::StringBuffer> {
 public:
  Text() { Reset(buffer_); }

  std::string_view write(const Dictionary& payload) {
    giveBack();
    buffer_.Clear();
    Reset(buffer_);
    add(payload);
    return {buffer_.GetString(), buffer_.GetSize()};
  }

  // Frees the memory of a large payload. It would otherwise stay allocated until the service ends.
  void giveBack() {
    if (buffer_.stack_.GetCapacity() > kKeptBufferBytes) buffer_ = rapidjson::StringBuffer();
  }

 private:
  void add(const Dictionary& dictionary) {
    StartObject();
    for (const Dictionary::Entry& entry : dictionary) {
      add(entry.key.text());
      add(entry.value);
    }
    EndObject();
  }

  void add(const Array& array) {
    StartArray();
    for (const Value& value : array) add(value);
    EndArray();
  }

  void add(const Value& value) {
    switch (value.kind()) {
      case ValueKind::kNone:
        Null();
        return;
      case ValueKind::kNumber:
        return addNumber(value);
      case ValueKind::kString:
        return add(value.string());
      case ValueKind::kDate:
        return addDate(value.date());
      case ValueKind::kData:
        return addPlain(base64(value.data().bytes()));
      case ValueKind::kArray:
        return add(value.array());
      case ValueKind::kDictionary:
        return add(value.dictionary());
    }
  }

  void add(std::string_view text) {
    switch (classify(text)) {
      case TextKind::kPlain:
        return addPlain(text);
      case TextKind::kEscapesNeeded:
        return addEscaped(text);
      case TextKind::kNotAscii:
        // Texts from files or other processes may contain any bytes. RapidJSON would copy invalid
        // bytes, and readers would then refuse the whole payload.
        return addEscaped(replaceInvalidUtf8(text));
    }
  }

  void addPlain(std::string_view text) {
    Prefix(rapidjson::kStringType);
    char* out = buffer_.Push(text.size() + 2);
    *out = '"';
    std::memcpy(out + 1, text.data(), text.size());
    out[text.size() + 1] = '"';
  }

  void addEscaped(std::string_view text) {
    String(text.data(), static_cast<rapidjson::SizeType>(text.size()));
  }

  void addNumber(const Value& value) {
    switch (value.numberKind()) {
      case NumberKind::kBool:
        Bool(value.toBool());
        return;
      // Do not write a float as a double. The shortest form of 0.1F is "0.1" as a float, but
      // "0.10000000149011612" as a double.
      case NumberKind::kFloat:
        return addReal(static_cast<float>(value.toDouble()));
      case NumberKind::kDouble:
        return addReal(value.toDouble());
      case NumberKind::kUInt8:
      case NumberKind::kUInt16:
      case NumberKind::kUInt32:
      case NumberKind::kUInt64:
        return addDecimal(value.toUInt64());
      case NumberKind::kInt16:
      case NumberKind::kInt32:
      case NumberKind::kInt64:
        return addDecimal(value.toInt64());
    }
  }

  template <typename Real>
  void addReal(Real number) {
    // JSON has no NaN and no infinities. RapidJSON's writer would refuse them and leave the object
    // incomplete.
    if (std::isnan(number)) return addPlain("NaN");
    if (std::isinf(number)) return addPlain(number > 0 ? "Infinity" : "-Infinity");
    addDecimal(number);
  }

  template <typename Number>
  void addDecimal(Number number) {
    Prefix(rapidjson::kNumberType);
    char* const out = buffer_.Push(kLongestNumber);
    const char* const end = std::to_chars(out, out + kLongestNumber, number).ptr;
    buffer_.Pop(kLongestNumber - static_cast<std::size_t>(end - out));
  }

  void addDate(Date date) {
    const double seconds = date.secondsSince1970;
    // Negate the condition: every comparison with NaN is false, and NaN is then not written as a
    // date.
    if (!(seconds >= kEarliest && seconds < kEnd)) return addReal(seconds);
    std::array<char, 64> buffer;
    addPlain(dateText(seconds, buffer));
  }

  rapidjson::StringBuffer buffer_;
};

PayloadEncoder::PayloadEncoder() : text_(std::make_unique<Text>()) {}
PayloadEncoder::~PayloadEncoder() = default;

std::string_view PayloadEncoder::encode(const Dictionary& payload) { return text_->write(payload); }

void PayloadEncoder::giveBack() { text_->giveBack(); }

bool encodeAlike(const Dictionary& left, const Dictionary& right) {
  if (left.isIdenticalTo(right)) return true;
  return std::ranges::equal(left, right, [](const auto& one, const auto& other) {
    return one.key == other.key && alike(one.value, other.value);
  });
}

}  // namespace halvox::platform::linux_
