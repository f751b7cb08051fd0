#include "platform/linux/pipewire/MissedCycles.h"

#include <algorithm>

namespace halvox::pipewire {
namespace {

// The driver of a cycle whose driver the profiler does not name. No node has this ID.
constexpr std::uint32_t kNoDriver = 0xFFFFFFFF;

CycleFault faultOf(const ProfiledCycle& cycle) {
  if (!cycle.late.empty()) return CycleFault::kFollowers;
  return cycle.followers.empty() && cycle.waiting.empty() ? CycleFault::kUnknown
                                                          : CycleFault::kDriver;
}

}  // namespace

MissedCycles::Loss MissedCycles::add(const ProfiledCycle& cycle) {
  const auto [found, isFirst] =
      drivers_.try_emplace(cycle.driver.has_value() ? cycle.driver->id : kNoDriver);
  Driver& driver = found->second;
  const bool isRepeated = !isFirst && driver.time == cycle.time;
  // A driver that restarts may begin its count again.
  const bool hasXruns = !isFirst && cycle.driverXruns > driver.xruns;
  std::uint32_t xruns = hasXruns ? cycle.driverXruns - driver.xruns : 0;
  driver.time = cycle.time;
  driver.xruns = cycle.driverXruns;

  const std::uint32_t known = std::min(xruns, driver.expected);
  xruns -= known;
  driver.expected -= known;
  const bool isUnfinished = !isRepeated && !cycle.late.empty();
  if (isUnfinished && xruns == 0) {
    ++driver.expected;
    return {.count = 1, .fault = CycleFault::kFollowers};
  }
  // The device has recovered: a later xrun has another cause.
  if (!isRepeated && !isUnfinished) driver.expected = 0;
  if (xruns == 0) return {};
  return {.count = xruns, .fault = faultOf(cycle)};
}

}  // namespace halvox::pipewire
