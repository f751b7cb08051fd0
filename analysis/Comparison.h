#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "analysis/ReportData.h"

// What changed between two periods, and how sure that is.
namespace halvox::analysis {

enum class Verdict : std::uint8_t {
  kWorse,    // a problem is more frequent, or work takes longer
  kHigher,   // the same for figures of which more is neither good nor bad
  kUnclear,  // the figures differ by no more than chance may explain, or too little was recorded
  kLower,
  kBetter,
};

// "worse", "higher", "unclear", "lower", "better".
[[nodiscard]] std::string_view verdictName(Verdict verdict);

// One figure in both periods.
struct Change {
  enum class Kind : std::uint8_t {
    kXruns,         // reports of xruns for each hour of playing
    kMilliseconds,  // lost to xruns for each hour of playing
    kDeviceTime,    // a percentile of what the cycles of a device took
    kIssues,        // metrics of detected issues for each hour of the period
    kEvents,        // events of one name for each hour of the period
  };
  Kind kind = Kind::kXruns;
  std::string what{};  // "xruns", "busytime p95", the name of an event
  std::string of{};    // "all streams", "application player", "device Speakers", or empty
  std::string unit{};  // "/h", "ms/h", or that of the device's times
  // Nothing if there was nothing to measure: no stream played, no cycle was timed.
  std::optional<double> before{};
  std::optional<double> after{};
  // The ratio of after to before. Nothing if one of them is missing or both are 0.
  std::optional<double> ratio{};
  // The true ratio is between them in 95 of 100 cases. Nothing if too little was recorded to tell.
  std::optional<double> low{};
  std::optional<double> high{};
  Verdict verdict = Verdict::kUnclear;
};

// How many hours all streams of a period played, together.
[[nodiscard]] double hoursOf(const ReportData& data);

// Compares two periods. The list begins with what got worse beyond chance, the largest ratio first;
// then come higher, unclear, lower and better. See docs/report.md for the statistics.
[[nodiscard]] std::vector<Change> compare(const ReportData& before, const ReportData& after);

}  // namespace halvox::analysis
