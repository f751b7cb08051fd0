#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

namespace halvox::tools {

// What the name of a session's summary file tells.
struct SummaryName {
  std::string time;  // local at the service, such as "2023-11-14 22:13:20 +0000"
  std::int64_t secondsSince1970 = 0;
  std::string application;
  std::string service;
};

// Takes "20231114-221320+0000-halvox-APPLICATION-SERVICE.json" apart; none when it is no such name.
// An application may have hyphens in its name, a service has none.
std::optional<SummaryName> parseSummaryName(std::string_view name);

// What a summary comes to as a whole.
struct SummaryTotals {
  std::uint64_t messages = 0;
  std::uint64_t volumeIntervals = 0;
  // From the first to the last message that has a time stamp; none without any.
  std::optional<double> seconds;
};

// Called for each message in its order: its identifier, and itself as a JSON object on one line.
using SummaryMessageHandler =
    std::function<void(std::string_view identifier, std::string_view message)>;

// Reads a summary in the memory of one message. False, with the reason, when it cannot be read or
// is none; messages before the place that is wrong were handed over then.
bool readSummary(const std::string& path, const SummaryMessageHandler& handler,
                 SummaryTotals& totals, std::string& error);

}  // namespace halvox::tools
