#include "platform/value_description.h"

#include <array>
#include <charconv>
#include <chrono>
#include <cmath>
#include <cstdio>

namespace halvox::platform {
namespace {

template <typename Number>
void appendShortest(std::string& text, Number number) {
  std::array<char, 32> buffer;
  const auto result = std::to_chars(buffer.data(), buffer.data() + buffer.size(), number);
  text.append(buffer.data(), result.ptr);
}

void appendNumber(std::string& text, const Value& value) {
  switch (value.numberKind()) {
    case NumberKind::kFloat:
      return appendShortest(text, static_cast<float>(value.toDouble()));
    case NumberKind::kDouble:
      return appendShortest(text, value.toDouble());
    case NumberKind::kBool:
    case NumberKind::kUInt8:
    case NumberKind::kUInt16:
    case NumberKind::kUInt32:
    case NumberKind::kUInt64:
      return appendShortest(text, value.toUInt64());
    case NumberKind::kInt16:
    case NumberKind::kInt32:
    case NumberKind::kInt64:
      return appendShortest(text, value.toInt64());
  }
}

// Dates outside these years are printed as seconds, because they are mistakes and because the
// calendar of std::chrono ends with the year 32767.
constexpr double kEarliest = -62135596800.0;  // 0001-01-01
constexpr double kLatest = 253402300799.0;    // 9999-12-31

// Always UTC, because a log line must mean the same on every machine.
void appendDate(std::string& text, Date date) {
  using namespace std::chrono;
  const double whole = std::floor(date.secondsSince1970);
  if (!(whole >= kEarliest && whole <= kLatest)) {
    appendShortest(text, date.secondsSince1970);
    text += " s since 1970";
    return;
  }
  const sys_seconds time{seconds{static_cast<std::int64_t>(whole)}};
  const auto day = floor<days>(time);
  const year_month_day calendar{day};
  const hh_mm_ss clock{time - day};
  std::array<char, 64> buffer;
  const int length = std::snprintf(
      buffer.data(), buffer.size(), "%04d-%02u-%02u %02d:%02d:%02d +0000",
      static_cast<int>(calendar.year()), static_cast<unsigned>(calendar.month()),
      static_cast<unsigned>(calendar.day()), static_cast<int>(clock.hours().count()),
      static_cast<int>(clock.minutes().count()), static_cast<int>(clock.seconds().count()));
  text.append(buffer.data(), static_cast<std::size_t>(length));
}

void appendData(std::string& text, const Data& data) {
  constexpr std::string_view kDigits = "0123456789abcdef";
  text += '<';
  for (const std::byte byte : data.bytes()) {
    text += kDigits[std::to_integer<unsigned>(byte) >> 4U];
    text += kDigits[std::to_integer<unsigned>(byte) & 15U];
  }
  text += '>';
}

void appendArray(std::string& text, const Array& array) {
  text += '(';
  for (const Value& value : array) {
    if (&value != array.begin()) text += ", ";
    appendDescription(text, value);
  }
  text += ')';
}

void appendDictionary(std::string& text, const Dictionary& dictionary) {
  text += '{';
  for (const Dictionary::Entry& entry : dictionary) {
    if (&entry != dictionary.begin()) text += "; ";
    text += entry.key.text();
    text += " = ";
    appendDescription(text, entry.value);
  }
  text += '}';
}

}  // namespace

void appendDescription(std::string& text, const Value& value) {
  switch (value.kind()) {
    case ValueKind::kNone:
      text += "(null)";
      return;
    case ValueKind::kNumber:
      return appendNumber(text, value);
    case ValueKind::kString:
      text += value.string();
      return;
    case ValueKind::kDate:
      return appendDate(text, value.date());
    case ValueKind::kData:
      return appendData(text, value.data());
    case ValueKind::kArray:
      return appendArray(text, value.array());
    case ValueKind::kDictionary:
      return appendDictionary(text, value.dictionary());
  }
}

std::string describe(const Value& value) {
  std::string text;
  appendDescription(text, value);
  return text;
}

std::string describe(const Dictionary& dictionary) {
  std::string text;
  appendDictionary(text, dictionary);
  return text;
}

std::string describe(const Message& message) {
  return message.has_value() ? describe(*message) : "(null)";
}

}  // namespace halvox::platform
