#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <string>

#include "tools/status/ServiceStatus.h"

namespace halvox::tools {

// Scales a count since the start to a period, such as an hour. Nothing without a count, and before
// the service has run for a second: the result would only show the start.
[[nodiscard]] std::optional<double> perPeriod(std::optional<std::uint64_t> count,
                                              std::optional<double> uptimeSeconds,
                                              double periodSeconds);

// Formats the status for a person, in lines of at most `width` columns; without a width, in whole
// lines. Characters that could control a terminal are escaped.
[[nodiscard]] std::string statusText(const ServiceStatus& status, std::optional<std::size_t> width);

// Formats the status as a JSON object on one line, without a line end.
[[nodiscard]] std::string statusJson(const ServiceStatus& status);

}  // namespace halvox::tools
