#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

#include "platform/linux/base/Result.h"

namespace halvox::tools {

// The parts of the name of a summary file.
struct SummaryName {
  std::string time;  // in the time zone of the service, such as "2023-11-14 22:13:20 +0000"
  std::int64_t secondsSince1970 = 0;
  std::string application;
  std::string service;
};

// Splits "20231114-221320+0000-halvox-APPLICATION-SERVICE.json". Returns nothing for another name.
// The name of an application may have hyphens; that of a service has none.
std::optional<SummaryName> parseSummaryName(std::string_view name);

// The totals of one summary.
struct SummaryTotals {
  std::uint64_t messages = 0;
  std::uint64_t volumeIntervals = 0;
  // The time from the first to the last message with a time stamp; none if there is no time stamp.
  std::optional<double> seconds;
};

// Called for each message in order, with its identifier and the message as a JSON object on one
// line.
using SummaryMessageHandler =
    std::function<void(std::string_view identifier, std::string_view message)>;

// Reads a summary; holds at most one message in memory. Fails if the file cannot be read or is not
// a summary; the message does not name the file. The messages before the error were passed to
// `handler`.
platform::linux_::Result<SummaryTotals> readSummary(const std::string& path,
                                                    const SummaryMessageHandler& handler);

}  // namespace halvox::tools
