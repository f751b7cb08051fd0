#pragma once

#include <string>

// Times of exported records, in seconds since 1970.
namespace halvox::tools {

// The fewest digits that read back as the same time, without an exponent: "1700000000.25".
[[nodiscard]] std::string timeNumber(double seconds);

// "2026-11-21T22:44:05.123Z", rounded down like all times that commands print. Empty for a time
// that is so far off that it has no date.
[[nodiscard]] std::string utcTime(double seconds);

}  // namespace halvox::tools
