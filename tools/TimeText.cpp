#include "tools/TimeText.h"

#include <array>
#include <cctype>
#include <charconv>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <ctime>
#include <optional>
#include <string_view>
#include <system_error>
#include <utility>

namespace halvox::tools {
namespace {

using platform::linux_::Failure;
using platform::linux_::Result;

constexpr double kMinute = 60;
constexpr double kHour = 60 * kMinute;
constexpr double kDay = 24 * kHour;

std::optional<double> parseReal(std::string_view text) {
  double number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  const bool isWhole = error == std::errc() && end == text.data() + text.size();
  if (!isWhole || !std::isfinite(number)) return std::nullopt;
  return number;
}

// Reads a text from its beginning.
class TextCursor {
 public:
  explicit TextCursor(std::string_view text) : rest_(text) {}

  [[nodiscard]] bool isAtEnd() const { return rest_.empty(); }
  [[nodiscard]] bool isAtDigit() const { return !rest_.empty() && isDigit(rest_.front()); }
  bool take(char character) { return takeAnyOf({&character, 1}); }
  bool takeAnyOf(std::string_view characters) {
    if (rest_.empty() || characters.find(rest_.front()) == std::string_view::npos) return false;
    rest_.remove_prefix(1);
    return true;
  }
  // Reads a number of exactly that many digits.
  bool takeNumber(std::size_t digits, int& number) {
    if (rest_.size() < digits) return false;
    number = 0;
    for (std::size_t index = 0; index < digits; ++index) {
      if (!isDigit(rest_[index])) return false;
      number = 10 * number + (rest_[index] - '0');
    }
    rest_.remove_prefix(digits);
    return true;
  }
  // Reads the digits after a decimal point, at least one.
  bool takeFraction(double& fraction) {
    std::string text = "0.";
    while (isAtDigit()) {
      text += rest_.front();
      rest_.remove_prefix(1);
    }
    const auto parsed = parseReal(text);
    if (text.size() == 2 || !parsed) return false;
    fraction = *parsed;
    return true;
  }

 private:
  static bool isDigit(char character) { return character >= '0' && character <= '9'; }

  std::string_view rest_;
};

// The parts of a calendar time. Without an offset it is local time.
struct CalendarTime {
  std::tm fields{};
  double fraction = 0;
  std::optional<int> offset{};  // seconds east of Greenwich
};

bool isWithin(int number, int least, int most) { return number >= least && number <= most; }

// "2026-11-21" or, as in names of files, "20261121".
bool takeDate(TextCursor& text, std::tm& fields) {
  int year = 0;
  int month = 0;
  if (!text.takeNumber(4, year)) return false;
  const bool hasHyphens = text.take('-');
  if (!text.takeNumber(2, month) || text.take('-') != hasHyphens) return false;
  if (!text.takeNumber(2, fields.tm_mday)) return false;
  fields.tm_year = year - 1900;
  fields.tm_mon = month - 1;
  return isWithin(month, 1, 12) && isWithin(fields.tm_mday, 1, 31);
}

// "22:44", "22:44:05", "22:44:05.123" or, as in names of files, "224405".
bool takeTimeOfDay(TextCursor& text, CalendarTime& time) {
  std::tm& fields = time.fields;
  if (!text.takeNumber(2, fields.tm_hour)) return false;
  const bool hasColons = text.take(':');
  if (!text.takeNumber(2, fields.tm_min)) return false;
  const bool hasSeconds = hasColons ? text.take(':') : text.isAtDigit();
  if (hasSeconds && !text.takeNumber(2, fields.tm_sec)) return false;
  if (hasSeconds && text.take('.') && !text.takeFraction(time.fraction)) return false;
  // 60 is a leap second.
  return isWithin(fields.tm_hour, 0, 23) && isWithin(fields.tm_min, 0, 59) &&
         isWithin(fields.tm_sec, 0, 60);
}

// Nothing, or "Z", "+01:00", "+0100" or "+01", with or without a blank before it.
bool takeZone(TextCursor& text, std::optional<int>& offset) {
  if (text.isAtEnd()) return true;
  text.take(' ');
  if (text.takeAnyOf("Zz")) {
    offset = 0;
    return true;
  }
  const bool isWest = text.take('-');
  int hours = 0;
  int minutes = 0;
  if ((!isWest && !text.take('+')) || !text.takeNumber(2, hours)) return false;
  const bool hasMinutes = text.take(':') || !text.isAtEnd();
  if (hasMinutes && !text.takeNumber(2, minutes)) return false;
  const int seconds = (hours * 60 + minutes) * 60;
  offset = isWest ? -seconds : seconds;
  return isWithin(hours, 0, 23) && isWithin(minutes, 0, 59);
}

// Returns nothing if there is no such day.
std::optional<double> secondsOf(CalendarTime time) {
  const int day = time.fields.tm_mday;
  // The C library finds out whether it is summer time at that moment.
  time.fields.tm_isdst = -1;
  const std::time_t seconds =
      time.offset ? timegm(&time.fields) - *time.offset : mktime(&time.fields);
  if (time.fields.tm_mday != day) return std::nullopt;  // no such day: the 30th of February
  return static_cast<double>(seconds) + time.fraction;
}

std::optional<double> parseCalendarTime(std::string_view text) {
  TextCursor cursor(text);
  CalendarTime time;
  const bool isComplete = takeDate(cursor, time.fields) && cursor.takeAnyOf(" Tt-") &&
                          takeTimeOfDay(cursor, time) && takeZone(cursor, time.offset) &&
                          cursor.isAtEnd();
  if (!isComplete) return std::nullopt;
  return secondsOf(time);
}

// A date alone, with hyphens: 20261121 would be seconds since 1970.
std::optional<double> parseDate(std::string_view text) {
  TextCursor cursor(text);
  CalendarTime time;
  const bool hasHyphens = text.find('-') != std::string_view::npos;
  if (!hasHyphens || !takeDate(cursor, time.fields) || !cursor.isAtEnd()) return std::nullopt;
  return secondsOf(time);
}

// Returns the seconds of "5min" or "-5min".
std::optional<double> parseAge(std::string_view text) {
  struct Unit {
    std::string_view name;
    double seconds;
  };
  constexpr std::array<Unit, 9> kUnits{{{"s", 1},
                                        {"sec", 1},
                                        {"m", kMinute},
                                        {"min", kMinute},
                                        {"h", kHour},
                                        {"hr", kHour},
                                        {"d", kDay},
                                        {"w", 7 * kDay},
                                        {"wk", 7 * kDay}}};
  if (text.starts_with('-')) text.remove_prefix(1);
  const auto unitBegin = text.find_last_not_of("abcdefghijklmnopqrstuvwxyz") + 1;
  const auto number = parseReal(text.substr(0, unitBegin));
  if (!number || *number < 0) return std::nullopt;
  for (const Unit& unit : kUnits) {
    if (text.substr(unitBegin) == unit.name) return *number * unit.seconds;
  }
  return std::nullopt;
}

// Returns the midnight at which the day of `now`, or another day, began.
double midnight(double now, int daysBefore) {
  const auto seconds = static_cast<std::time_t>(std::floor(now));
  std::tm fields{};
  if (localtime_r(&seconds, &fields) == nullptr) return now;
  // mktime() accepts a day of 0 or less, or more than the month has.
  fields.tm_mday -= daysBefore;
  fields.tm_hour = fields.tm_min = fields.tm_sec = 0;
  fields.tm_isdst = -1;
  return static_cast<double>(mktime(&fields));
}

std::string calendarTime(double seconds, std::tm* (*split)(const std::time_t*, std::tm*),
                         const char* zone) {
  // A database may hold any number. The year 10000 has no date that people would recognise.
  constexpr double kEnd = 253'402'300'800;
  if (!(std::abs(seconds) < kEnd)) return std::to_string(seconds);
  const double whole = std::floor(seconds);
  // Rounded down, because a time that was rounded up would lie after its record, and --since with
  // this time would skip the record.
  const auto milliseconds = static_cast<int>((seconds - whole) * 1000);
  const auto time = static_cast<std::time_t>(whole);
  std::tm fields{};
  std::array<char, 64> date{};
  if (split(&time, &fields) == nullptr ||
      std::strftime(date.data(), date.size(), "%Y-%m-%d %H:%M:%S", &fields) == 0) {
    return std::to_string(seconds);  // so far off that it has no date
  }
  std::array<char, 8> fraction{};
  std::snprintf(fraction.data(), fraction.size(), ".%03d", milliseconds);
  return std::string(date.data()) + fraction.data() + zone;
}

}  // namespace

double timeNow() {
  const auto time = std::chrono::system_clock::now().time_since_epoch();
  return std::chrono::duration<double>(time).count();
}

std::optional<std::pair<double, double>> parseDay(std::string_view text, double now) {
  std::optional<double> begin;
  if (text == "today") begin = midnight(now, 0);
  if (text == "yesterday") begin = midnight(now, 1);
  if (!begin) begin = parseDate(text);
  if (!begin) return std::nullopt;
  // A day may have 23 or 25 hours.
  return std::pair(*begin, midnight(*begin, -1));
}

Result<double> parseTime(std::string_view text, double now) {
  if (text == "now") return now;
  if (const auto day = parseDay(text, now)) return day->first;
  if (const auto seconds = parseReal(text.starts_with('@') ? text.substr(1) : text)) {
    return *seconds;
  }
  if (const auto age = parseAge(text)) return now - *age;
  if (const auto time = parseCalendarTime(text)) return *time;
  return Failure<>{"\"" + std::string(text) +
                   "\" is not a time; expected one such as \"2026-11-21 22:44\", 2026-11-21, "
                   "2026-11-21T22:44:05+01:00, today, yesterday, 5min or 2h (that long ago), or "
                   "@1795313222 (seconds since 1970)"};
}

std::string localTime(double seconds) { return calendarTime(seconds, localtime_r, ""); }

std::string utcClockTime(double seconds) { return calendarTime(seconds, gmtime_r, "Z"); }

}  // namespace halvox::tools
