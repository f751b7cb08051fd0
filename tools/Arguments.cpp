#include "tools/Arguments.h"

#include <charconv>
#include <cmath>
#include <ctime>
#include <limits>
#include <span>

#include "client/Vocabulary.h"

namespace halvox::tools {
namespace {

using client::NamedNumber;

template <typename Number>
std::optional<Number> parseWhole(std::string_view text) {
  int base = 10;
  if (text.starts_with("0x") || text.starts_with("0X")) {
    text.remove_prefix(2);
    base = 16;
    if (text.starts_with('-')) return std::nullopt;  // a sign stands before the 0x, or nowhere
  }
  Number number{};
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number, base);
  if (error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return number;
}

std::optional<double> parseReal(std::string_view text) {
  double number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  const bool whole = error == std::errc() && end == text.data() + text.size();
  if (!whole || !std::isfinite(number)) return std::nullopt;
  return number;
}

std::string listNames(std::span<const NamedNumber> table) {
  std::string list;
  for (const auto& entry : table) {
    if (!list.empty()) list += ", ";
    list.append(entry.name).append(" (").append(std::to_string(entry.number)).append(")");
  }
  return list;
}

std::string listDomains() {
  std::string list;
  for (const auto& domain : client::domains()) {
    if (!list.empty()) list += ", ";
    list.append(domain.name).append("_");
  }
  return list;
}

ArgumentError unknown(std::string_view text, const std::string& expected) {
  return {"\"" + std::string(text) + "\" is not known; expected " + expected};
}

// The part of a time after its seconds: a fraction, then an offset or nothing.
struct TimeTail {
  double fraction = 0;
  std::optional<long> offset;  // seconds east of Greenwich; none: local time
};

std::optional<TimeTail> parseTimeTail(const char* text) {
  TimeTail tail;
  if (*text == '.') {
    const char* end = text + 1;
    while (*end >= '0' && *end <= '9') ++end;
    const auto fraction = parseReal(std::string("0").append(text, end));
    if (end == text + 1 || !fraction) return std::nullopt;
    tail.fraction = *fraction;
    text = end;
  }
  if (*text == '\0') return tail;
  std::tm zone{};
  const std::string_view zoneText(text);
  const char* end = zoneText == "z" ? text + 1 : strptime(text, "%z", &zone);
  if (end == nullptr || *end != '\0') return std::nullopt;
  tail.offset = zone.tm_gmtoff;
  return tail;
}

std::optional<double> parseCalendarTime(const std::string& text) {
  // strptime() would also take blanks and missing digits.
  constexpr std::string_view kShape = "0000-00-00T00:00:00";
  if (text.size() < kShape.size()) return std::nullopt;
  std::string start = text.substr(0, kShape.size());
  if (start[10] == ' ' || start[10] == 't') start[10] = 'T';
  for (std::size_t at = 0; at < kShape.size(); ++at) {
    const bool isDigit = start[at] >= '0' && start[at] <= '9';
    if (kShape[at] == '0' ? !isDigit : start[at] != kShape[at]) return std::nullopt;
  }
  std::tm fields{};
  const char* end = strptime(start.c_str(), "%Y-%m-%dT%H:%M:%S", &fields);
  const auto tail = parseTimeTail(text.c_str() + kShape.size());
  if (end == nullptr || !tail) return std::nullopt;
  const int day = fields.tm_mday;
  fields.tm_isdst = -1;
  const std::time_t seconds = tail->offset ? timegm(&fields) - *tail->offset : mktime(&fields);
  if (fields.tm_mday != day) return std::nullopt;  // no such day: the 30th of February
  return static_cast<double>(seconds) + tail->fraction;
}

std::optional<double> parseAge(std::string_view text) {
  if (text.empty()) return std::nullopt;
  const auto number = parseReal(text.substr(0, text.size() - 1));
  if (!number || *number < 0) return std::nullopt;
  switch (text.back()) {
    case 's':
      return *number;
    case 'm':
      return *number * 60;
    case 'h':
      return *number * 60 * 60;
    case 'd':
      return *number * 24 * 60 * 60;
    default:
      return std::nullopt;
  }
}

}  // namespace

Parsed<client::ReporterID> parseReporterID(std::string_view text) {
  if (const auto id = parseWhole<client::ReporterID>(text)) return *id;
  return ArgumentError{"\"" + std::string(text) +
                       "\" is no reporter ID; expected a whole number of 64 bits, such as 7"};
}

Parsed<std::int64_t> parseNumber(std::string_view text) {
  if (const auto number = parseWhole<std::int64_t>(text)) return *number;
  return ArgumentError{"\"" + std::string(text) + "\" is no number; expected a whole number"};
}

Parsed<std::uint64_t> parseCount(std::string_view text) {
  if (const auto count = parseWhole<std::uint64_t>(text)) return *count;
  return ArgumentError{"\"" + std::string(text) +
                       "\" is no number; expected a whole number from 0 on, such as 10"};
}

Parsed<client::Category> parseCategory(std::string_view text) {
  if (const auto number = parseWhole<client::Category>(text)) return *number;
  if (const auto category = client::findCategory(text)) return *category;
  return unknown(text, "a number of 32 bits or one of " + listNames(client::categories()) +
                           ", alone or behind one of " + listDomains());
}

Parsed<client::EventType> parseEventType(std::string_view text) {
  if (const auto number = parseWhole<client::EventType>(text)) return *number;
  if (const auto type = client::findEventType(text)) return *type;
  return unknown(text, "a number up to 65535 or one of " + listNames(client::eventTypes()));
}

Parsed<client::ServiceType> parseServiceType(std::string_view text) {
  if (const auto number = parseWhole<client::ServiceType>(text)) return *number;
  if (const auto type = client::findServiceType(text)) return *type;
  return unknown(text, "a number up to 65535 or one of " + listNames(client::serviceTypes()));
}

Parsed<std::chrono::milliseconds> parseSeconds(std::string_view text) {
  constexpr double kMost = 1e9;
  const auto seconds = parseReal(text);
  if (!seconds || *seconds <= 0 || *seconds > kMost) {
    return ArgumentError{"\"" + std::string(text) +
                         "\" is no time; expected seconds, more than 0, such as 0.5 or 10"};
  }
  return std::chrono::ceil<std::chrono::milliseconds>(std::chrono::duration<double>(*seconds));
}

Parsed<double> parseTime(std::string_view text, double now) {
  if (const auto seconds = parseReal(text)) return *seconds;
  if (const auto age = parseAge(text)) return now - *age;
  if (const auto time = parseCalendarTime(std::string(text))) return *time;
  return ArgumentError{"\"" + std::string(text) +
                       "\" is no time; expected a date such as 2026-03-01T12:00:00Z, seconds since "
                       "1970, or how long ago: 90s, 5m, 2h, 3d"};
}

}  // namespace halvox::tools
