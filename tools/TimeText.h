#pragma once

#include <optional>
#include <string>
#include <string_view>
#include <utility>

#include "platform/linux/base/Result.h"

// Converts between times in seconds since 1970 and texts that people type and commands print.
namespace halvox::tools {

// The time now, in seconds since 1970, by the wall clock, whose times the store has.
double timeNow();

// Parses a time that somebody typed or that a command printed:
//   2026-11-21 22:44, optionally with seconds and a fraction, in local time. "T" may replace the
//     blank, and "Z" or an offset such as +01:00 may follow, with or without a blank
//   today, yesterday, 2026-11-21 (the midnight at which they began), now
//   5min, 90s, 2h, 3d, 1w, optionally with "-" before them: that long before `now`
//   @1795313222.7, 1795313222.7: seconds since 1970
platform::linux_::Result<double> parseTime(std::string_view text, double now);

// Returns when a day began and ended, in local time: today, yesterday or 2026-11-21. Nothing if the
// text is not a day.
std::optional<std::pair<double, double>> parseDay(std::string_view text, double now);

// Formats a time as local time, rounded down to milliseconds: "2026-11-21 22:44:05.123".
std::string localTime(double seconds);
// The same in UTC: "2026-11-21 21:44:05.123Z".
std::string utcClockTime(double seconds);

}  // namespace halvox::tools
