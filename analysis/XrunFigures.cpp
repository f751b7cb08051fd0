#include "analysis/XrunFigures.h"

#include <algorithm>

namespace halvox::analysis {
namespace {

constexpr double kMillisecondsPerSecond = 1000;
constexpr double kLongestMilliseconds = 24 * 60 * 60 * kMillisecondsPerSecond;
constexpr std::int64_t kMostCycles = std::int64_t{1} << 40U;

}  // namespace

bool isXrun(std::string_view type, const Payload& payload) {
  return type == "IssueDetector" && payload.text("issue_type") == "xrun";
}

XrunFigures xrunFigures(const Payload& payload) {
  double milliseconds = 0;
  if (const auto exact = payload.number("xrun_milliseconds")) {
    milliseconds = *exact;
  } else if (const auto seconds = payload.number("any_channel_silence_seconds")) {
    milliseconds = *seconds * kMillisecondsPerSecond;
  }
  const std::int64_t cycles = payload.integer("missed_cycles").value_or(0);
  return {
      .milliseconds = std::clamp(milliseconds, 0.0, kLongestMilliseconds),
      .missedCycles = static_cast<std::uint64_t>(std::clamp<std::int64_t>(cycles, 0, kMostCycles))};
}

}  // namespace halvox::analysis
