#pragma once

#include <string>
#include <string_view>

#include "tools/Arguments.h"

// Moments, in seconds since 1970, as text: what people type and what commands print.
namespace halvox::tools {

// A moment that somebody typed or that a command printed:
//   2026-11-21 22:44, with or without seconds and a fraction, in local time; "T" may stand for the
//     blank, and "Z" or an offset such as +01:00, with or without a blank, may follow
//   today, yesterday (the midnight that they began with), now
//   5min, 90s, 2h, 3d, 1w, also with "-" before them: how long before `now`
//   @1795313222.7, 1795313222.7: the seconds themselves
Parsed<double> parseTime(std::string_view text, double now);

// A moment in local time, to the millisecond, rounded down: "2026-11-21 22:44:05.123".
std::string localTime(double seconds);

}  // namespace halvox::tools
