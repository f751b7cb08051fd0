#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

// What a session's driver reports say. Pure functions: any thread may call.
namespace halvox::analysis {

// A key of a driver report: "demo-speakers_Speaker_PipeWire_Histogram_busytime". Driver, group and
// subgroup may be missing.
struct DriverReportKey {
  std::string_view device;   // the driver, else the group
  std::string_view channel;  // "busytime"
};
// Returns nothing for another text. `type` is "Simple", "Histogram" or "State".
[[nodiscard]] std::optional<DriverReportKey> parseDriverReportKey(std::string_view key,
                                                                  std::string_view type);

// Calls `bucket` for each bucket of a histogram's text, "count=…,unit=us::0-50:161;50-100:5", and
// returns its unit. Returns nothing if the text is not a histogram; buckets before the fault were
// delivered. The upper bound is infinity if the channel has none.
using DriverBucket = std::function<void(double lower, double upper, std::uint64_t hits)>;
[[nodiscard]] std::optional<std::string_view> parseDriverHistogram(std::string_view text,
                                                                   const DriverBucket& bucket);

}  // namespace halvox::analysis
