#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "tools/TextTable.h"
#include "tools/top/TopSnapshot.h"

// A snapshot as texts for people. All texts are free of characters that could control a terminal.
// Pure functions: any thread may call.
namespace halvox::tools {

// "4.2/s", "120/s"; "-" if it is not known.
[[nodiscard]] std::string rateText(const std::optional<double>& perSecond);
// "12 B", "3.4 MiB"; "-" if it is not known.
[[nodiscard]] std::string bytesText(const std::optional<std::uint64_t>& bytes);

// The figures of the service, one text each: "clients 4".
[[nodiscard]] std::vector<std::string> serviceTexts(const TopSnapshot& snapshot);
// What was lost, one text for each reason: "link local, dropped: disk full 12 (+3.0/s)".
[[nodiscard]] std::vector<std::string> lossTexts(const std::vector<TopLoss>& losses);

[[nodiscard]] TextTable deviceTable(const std::vector<TopDevice>& devices);
[[nodiscard]] TextTable streamTable(const std::vector<TopStream>& streams);

// A snapshot for an output that is not a terminal: every text whole, ended by an empty line.
[[nodiscard]] std::string batchText(const TopSnapshot& snapshot);
// A snapshot as one JSON object on one line, without a line end.
[[nodiscard]] std::string batchJson(const TopSnapshot& snapshot);

}  // namespace halvox::tools
