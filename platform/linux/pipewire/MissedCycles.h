#pragma once

#include <chrono>
#include <cstdint>
#include <unordered_map>

#include "platform/linux/pipewire/ProfileDecoder.h"

namespace halvox::pipewire {

// Who caused the loss of a cycle.
enum class CycleFault : std::uint8_t {
  kUnknown,    // the profiler does not list the nodes that follow the driver
  kFollowers,  // those in `late` of the cycle
  kDriver,     // all followers had finished, and the driver nevertheless had an xrun
};

// Counts the cycles that the drivers of a server missed, each of them once.
//
// PipeWire shows a missed cycle in up to two ways: as a cycle that had not finished when the next
// one began, and as an xrun, which a driver counts if its device ran out of data. Neither is
// enough. A driver without hardware counts no xruns, and a device may have an xrun although all
// nodes were in time. If both happen, the xrun is visible in the profile of the unfinished cycle
// or, because the device notices it later, in that of a cycle after it. One xrun is therefore
// expected for each unfinished cycle, until a cycle finishes, and not counted again.
//
// The sum of all counts is never lower than what the drivers have counted.
// A plain value that belongs to one thread. Holds a few numbers for each driver.
class MissedCycles {
 public:
  struct Loss {
    std::uint32_t count = 0;  // of cycles; 0 if none was missed
    CycleFault fault = CycleFault::kUnknown;
    friend bool operator==(const Loss&, const Loss&) = default;
  };

  // Returns what was missed with this cycle. Call it for all cycles of a driver in their order. The
  // server reports an unfinished cycle twice in a row; the second report adds only further xruns.
  // The first cycle of a driver has no xruns: its driver may have counted them hours ago.
  [[nodiscard]] Loss add(const ProfiledCycle& cycle);
  // The driver's node has disappeared. Another node may get its ID.
  void forget(std::uint32_t driver) { drivers_.erase(driver); }
  // Cycles were not reported for some time, or come from another server from now on.
  void clear() { drivers_.clear(); }

 private:
  struct Driver {
    std::chrono::nanoseconds time{};  // of the last cycle
    std::uint32_t xruns = 0;          // as the driver counts them
    std::uint32_t expected = 0;       // xruns of unfinished cycles, which are counted already
  };

  std::unordered_map<std::uint32_t, Driver> drivers_;
};

}  // namespace halvox::pipewire
