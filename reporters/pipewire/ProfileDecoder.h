#pragma once

#include <chrono>
#include <cstdint>
#include <vector>

struct spa_pod;

namespace halvox::pipewire_reporter {

// What PipeWire's profiler tells of one cycle of a driver, as far as it is of interest.
struct ProfiledCycle {
  std::chrono::nanoseconds time{};         // of the driver's clock
  std::chrono::duration<double> length{};  // what each node had to produce or take
  // The nodes whose turn it was and that had not finished when the cycle ended.
  std::vector<std::uint32_t> late;
  friend bool operator==(const ProfiledCycle&, const ProfiledCycle&) = default;
};

// The cycles of one event of the profiler, in order; those that cannot be read, or whose clock has
// no plausible length, are left out.
std::vector<ProfiledCycle> decodeProfile(const spa_pod* profile);

}  // namespace halvox::pipewire_reporter
