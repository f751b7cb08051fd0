#include <array>
#include <charconv>
#include <chrono>
#include <cmath>
#include <cstdio>

#include "platform/value.h"

namespace halvox::platform {
namespace {

template <typename Number>
std::string shortest(Number number) {
  std::array<char, 32> buffer;
  const auto result = std::to_chars(buffer.data(), buffer.data() + buffer.size(), number);
  return {buffer.data(), result.ptr};
}

std::string describeNumber(const Value& value) {
  switch (value.numberKind()) {
    case NumberKind::kFloat:
      return shortest(static_cast<float>(value.toDouble()));
    case NumberKind::kDouble:
      return shortest(value.toDouble());
    case NumberKind::kBool:
    case NumberKind::kUInt8:
    case NumberKind::kUInt16:
    case NumberKind::kUInt32:
    case NumberKind::kUInt64:
      return shortest(value.toUInt64());
    case NumberKind::kInt16:
    case NumberKind::kInt32:
    case NumberKind::kInt64:
      return shortest(value.toInt64());
  }
  return {};
}

// Dates outside these years are printed as seconds, because they are mistakes and because the
// calendar of std::chrono ends with the year 32767.
constexpr double kEarliest = -62135596800.0;  // 0001-01-01
constexpr double kLatest = 253402300799.0;    // 9999-12-31

// Always UTC, because a log line must mean the same on every machine.
std::string describeDate(Date date) {
  using namespace std::chrono;
  const double whole = std::floor(date.secondsSince1970);
  if (!(whole >= kEarliest && whole <= kLatest)) {
    return shortest(date.secondsSince1970) + " s since 1970";
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
  return {buffer.data(), static_cast<std::size_t>(length)};
}

std::string describeData(const Data& data) {
  constexpr std::string_view kDigits = "0123456789abcdef";
  std::string text = "<";
  for (const std::byte byte : data.bytes()) {
    text += kDigits[std::to_integer<unsigned>(byte) >> 4U];
    text += kDigits[std::to_integer<unsigned>(byte) & 15U];
  }
  return text + ">";
}

std::string describeArray(const Array& array) {
  std::string text = "(";
  for (const Value& value : array) {
    if (&value != array.begin()) text += ", ";
    text += describe(value);
  }
  return text + ")";
}

}  // namespace

std::string describe(const Value& value) {
  switch (value.kind()) {
    case ValueKind::kNone:
      return "(null)";
    case ValueKind::kNumber:
      return describeNumber(value);
    case ValueKind::kString:
      return std::string(value.string());
    case ValueKind::kDate:
      return describeDate(value.date());
    case ValueKind::kData:
      return describeData(value.data());
    case ValueKind::kArray:
      return describeArray(value.array());
    case ValueKind::kDictionary:
      return describe(value.dictionary());
  }
  return {};
}

std::string describe(const Dictionary& dictionary) {
  std::string text = "{";
  for (const Dictionary::Entry& entry : dictionary) {
    if (text.size() > 1) text += "; ";
    text += entry.key.text();
    text += " = ";
    text += describe(entry.value);
  }
  return text + "}";
}

std::string describe(const Message& message) {
  return message.has_value() ? describe(*message) : "(null)";
}

}  // namespace halvox::platform
