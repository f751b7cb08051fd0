#pragma once

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstdint>
#include <limits>

namespace halvox {

// A time as the number that messages carry: whole seconds, halves away from zero.
inline std::int32_t roundedSeconds(std::chrono::duration<double> time) {
  using Limits = std::numeric_limits<std::int32_t>;
  return static_cast<std::int32_t>(
      std::clamp<double>(std::round(time.count()), Limits::min(), Limits::max()));
}

}  // namespace halvox
