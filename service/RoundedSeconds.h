#pragma once

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstdint>
#include <limits>

namespace halvox {

// Rounds a time to whole seconds, as messages carry it: halves away from zero, limited to 32 bits.
// Without the limit, a time of more than 68 years would be undefined behaviour.
inline std::int32_t roundedSeconds(std::chrono::duration<double> time) {
  using Limits = std::numeric_limits<std::int32_t>;
  return static_cast<std::int32_t>(
      std::clamp<double>(std::round(time.count()), Limits::min(), Limits::max()));
}

}  // namespace halvox
