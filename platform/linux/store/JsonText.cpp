#include "platform/linux/store/JsonText.h"

#include <algorithm>
#include <array>
#include <charconv>
#include <chrono>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <span>
#include <string>
#include <utility>

#include "platform/linux/base/Utf8.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::size_t kFirstCapacity = 1024;
// No number is longer: the shortest form of a double has at most 24 characters, and an integer of
// 64 bits at most 20.
constexpr std::size_t kLongestNumber = 32;

// The range of dates that are written as RFC 3339, which has four digits for the year. Both bounds
// are in seconds since 1970.
constexpr double kEarliest = -62135596800.0;  // 0001-01-01
constexpr double kEnd = 253402300800.0;       // 10000-01-01

// Copies texts a word at a time and notes whether a byte needs more than a copy. One pass: nearly
// all texts are plain and short.
class PlainCopy {
 public:
  explicit PlainCopy(char* out) : out_(out) {}

  void copy(std::string_view text) {
    const char* from = text.data();
    std::size_t left = text.size();
    if (left < sizeof(std::uint64_t)) return copyShort(from, left);
    for (; left > sizeof(std::uint64_t); left -= sizeof(std::uint64_t)) {
      word<std::uint64_t>(from, out_);
      from += sizeof(std::uint64_t);
      out_ += sizeof(std::uint64_t);
    }
    // The last word overlaps the one before it.
    const std::size_t back = sizeof(std::uint64_t) - left;
    word<std::uint64_t>(from - back, out_ - back);
    out_ += left;
  }

  // Where the copied text ends.
  [[nodiscard]] char* end() const { return out_; }
  // True if all bytes are ASCII without quotes, backslashes and control characters.
  [[nodiscard]] bool isPlain() const { return (special_ & kHighs) == 0; }

 private:
  static constexpr std::uint64_t kOnes = 0x0101010101010101U;
  static constexpr std::uint64_t kHighs = kOnes * 0x80U;

  void copyShort(const char* from, std::size_t left) {
    constexpr std::size_t kHalf = sizeof(std::uint32_t);
    if (left >= kHalf) {
      word<std::uint32_t>(from, out_);
      word<std::uint32_t>(from + left - kHalf, out_ + left - kHalf);
    } else {
      for (std::size_t at = 0; at < left; ++at) word<std::uint8_t>(from + at, out_ + at);
    }
    out_ += left;
  }

  template <typename Word>
  void word(const char* from, char* to) {
    Word bytes = 0;
    std::memcpy(&bytes, from, sizeof bytes);
    std::memcpy(to, &bytes, sizeof bytes);
    note(bytes);
  }

  // The high bytes of a short word are zero. They would count as control characters.
  void note(std::uint8_t byte) { note(byte | (kOnes << 8U) * 'a'); }
  void note(std::uint32_t bytes) { note(bytes | (kOnes << 32U) * 'a'); }
  void note(std::uint64_t bytes) {
    const std::uint64_t quotes = bytes ^ (kOnes * '"');
    const std::uint64_t backslashes = bytes ^ (kOnes * '\\');
    // Each line sets the high bit of a byte that is not ASCII, below 0x20, a quote or a backslash.
    // The borrow of a subtraction may also mark the byte above such a byte. This does no harm,
    // because it only matters whether any byte is marked.
    special_ |= bytes;
    special_ |= (bytes - kOnes * 0x20U) & ~bytes;
    special_ |= (quotes - kOnes) & ~quotes;
    special_ |= (backslashes - kOnes) & ~backslashes;
  }

  char* out_;
  std::uint64_t special_ = 0;
};

// The letter after the backslash, or 0 for a character that has no such escape.
char escapeLetter(char character) {
  switch (character) {
    case '"':
    case '\\':
      return character;
    case '\b':
      return 'b';
    case '\f':
      return 'f';
    case '\n':
      return 'n';
    case '\r':
      return 'r';
    case '\t':
      return 't';
    default:  // all other characters
      return 0;
  }
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

}  // namespace

void JsonText::grow(std::size_t bytes) {
  const std::size_t capacity = std::max({kFirstCapacity, 2 * capacity_, size_ + bytes});
  std::unique_ptr<char[]> memory(new char[capacity]);
  if (size_ > 0) std::memcpy(memory.get(), memory_.get(), size_);
  memory_ = std::move(memory);
  capacity_ = capacity;
}

void JsonText::append(std::string_view text) {
  char* const out = reserve(text.size() + 2);
  *out = '"';
  PlainCopy copy(out + 1);
  copy.copy(text);
  if (!copy.isPlain()) return appendUnusual(text);
  *copy.end() = '"';
  size_ += text.size() + 2;
}

void JsonText::appendUnusual(std::string_view text) {
  std::string replaced;
  if (!isUtf8(text)) {
    // Texts from files or other processes may contain any bytes. Readers would refuse the whole
    // payload.
    replaced = replaceInvalidUtf8(text);
    text = replaced;
  }
  constexpr char kDigits[] = "0123456789ABCDEF";
  append('"');
  for (const char character : text) {
    if (const char letter = escapeLetter(character); letter != 0) {
      const char escape[] = {'\\', letter};
      appendPart({escape, sizeof escape});
    } else if (const auto code = static_cast<unsigned char>(character); code < 0x20) {
      const char escape[] = {'\\', 'u', '0', '0', kDigits[code >> 4U], kDigits[code & 0xFU]};
      appendPart({escape, sizeof escape});
    } else {
      append(character);
    }
  }
  append('"');
}

void JsonText::append(const Dictionary& dictionary) {
  append('{');
  bool isFirst = true;
  for (const Dictionary::Entry& entry : dictionary) {
    if (!std::exchange(isFirst, false)) append(',');
    append(entry.key.text());
    append(':');
    append(entry.value);
  }
  append('}');
}

void JsonText::append(const Array& array) {
  append('[');
  bool isFirst = true;
  for (const Value& value : array) {
    if (!std::exchange(isFirst, false)) append(',');
    append(value);
  }
  append(']');
}

void JsonText::append(const Value& value) {
  switch (value.kind()) {
    case ValueKind::kNone:
      return appendPart("null");
    case ValueKind::kNumber:
      return appendNumber(value);
    case ValueKind::kString:
      return append(value.string());
    case ValueKind::kDate:
      return appendDate(value.date());
    case ValueKind::kData:
      return appendBase64(value.data());
    case ValueKind::kArray:
      return append(value.array());
    case ValueKind::kDictionary:
      return append(value.dictionary());
  }
}

void JsonText::appendNumber(const Value& value) {
  switch (value.numberKind()) {
    case NumberKind::kBool:
      return appendPart(value.toBool() ? "true" : "false");
    // Do not write it as a double: the shortest form of 0.1F is "0.1" as a float, and
    // "0.10000000149011612" as a double.
    case NumberKind::kFloat:
      return appendReal(static_cast<float>(value.toDouble()));
    case NumberKind::kDouble:
      return appendReal(value.toDouble());
    case NumberKind::kUInt8:
    case NumberKind::kUInt16:
    case NumberKind::kUInt32:
    case NumberKind::kUInt64:
      return appendDecimal(value.toUInt64());
    case NumberKind::kInt16:
    case NumberKind::kInt32:
    case NumberKind::kInt64:
      return appendDecimal(value.toInt64());
  }
}

template <typename Real>
void JsonText::appendReal(Real number) {
  // JSON has no such numbers.
  if (std::isnan(number)) return append(std::string_view("NaN"));
  if (std::isinf(number)) return append(std::string_view(number > 0 ? "Infinity" : "-Infinity"));
  appendDecimal(number);
}

template <typename Number>
void JsonText::appendDecimal(Number number) {
  char* const out = reserve(kLongestNumber);
  const char* const end = std::to_chars(out, out + kLongestNumber, number).ptr;
  size_ += static_cast<std::size_t>(end - out);
}

void JsonText::appendDate(Date date) {
  const double seconds = date.secondsSince1970;
  // The condition is negated so that NaN does not count as a date.
  if (!(seconds >= kEarliest && seconds < kEnd)) return appendReal(seconds);
  std::array<char, 64> buffer;
  append(dateText(seconds, buffer));
}

void JsonText::appendBase64(const Data& data) {
  constexpr std::string_view kAlphabet =
      "ABCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijklmnopqrstuvwxyz0123456789+/";
  const std::span<const std::byte> bytes = data.bytes();
  char* out = reserve((bytes.size() + 2) / 3 * 4 + 2);
  const char* const begin = out;
  *out++ = '"';
  for (std::size_t index = 0; index < bytes.size(); index += 3) {
    const auto group = bytes.subspan(index, std::min<std::size_t>(3, bytes.size() - index));
    std::uint32_t bits = 0;
    for (std::size_t at = 0; at < 3; ++at) {
      bits = bits << 8U | (at < group.size() ? std::to_integer<std::uint32_t>(group[at]) : 0U);
    }
    for (std::size_t at = 0; at < 4; ++at) {
      *out++ = at <= group.size() ? kAlphabet[bits >> (18U - 6U * at) & 63U] : '=';
    }
  }
  *out++ = '"';
  size_ += static_cast<std::size_t>(out - begin);
}

}  // namespace halvox::platform::linux_
