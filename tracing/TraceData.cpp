#include "tracing/TraceData.h"

namespace halvox {

// 0 divided by 0 is intended for a measurement without results.
float TraceData::getAverageResult() const {
  float sum = 0;
  for (const std::uint64_t value : results_) sum += static_cast<float>(value);
  return sum / static_cast<float>(count_);
}

}  // namespace halvox
