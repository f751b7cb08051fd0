#include "analysis/RateSums.h"

#include <algorithm>

namespace halvox::analysis {

void RateSums::add(double hours, double count) {
  if (hours <= 0 && count <= 0) return;
  ++groups_;
  hours_ += hours;
  count_ += count;
  squaredCounts_ += count * count;
  squaredHours_ += hours * hours;
  products_ += hours * count;
}

std::optional<double> RateSums::perHour() const {
  if (hours_ <= 0) return std::nullopt;
  return count_ / hours_;
}

std::optional<double> RateSums::logVariance() const {
  const auto rate = perHour();
  if (!rate || count_ <= 0 || groups_ < kFewestGroups) return std::nullopt;
  // The sum of (count - rate * hours) squared. Rounding may make it a little less than 0.
  const double residuals =
      std::max(0.0, squaredCounts_ - 2 * *rate * products_ + *rate * *rate * squaredHours_);
  const auto groups = static_cast<double>(groups_);
  return groups / (groups - 1) * residuals / (count_ * count_);
}

}  // namespace halvox::analysis
