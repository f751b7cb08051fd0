#include "tools/top/MinuteCount.h"

#include <algorithm>
#include <cmath>

namespace halvox::tools {
namespace {

// Times come from stored messages and may be any number. A conversion of a number that the integer
// cannot hold would be undefined.
std::int64_t secondOf(double time) {
  constexpr double kMost = 1e15;
  return static_cast<std::int64_t>(
      std::floor(std::clamp(std::isfinite(time) ? time : 0, 0.0, kMost)));
}

}  // namespace

void MinuteCount::add(double time, std::uint64_t events, double amount) {
  if (seconds_ == nullptr) seconds_ = std::make_unique<std::array<Second, kSeconds>>();
  const std::int64_t second = secondOf(time);
  Second& slot = (*seconds_)[static_cast<std::size_t>(second) % kSeconds];
  // A record that comes after those of the next minute must not replace their count.
  if (second < slot.second) return;
  if (second > slot.second) slot = {.second = second};
  slot.total.events += events;
  slot.total.amount += amount;
}

MinuteCount::Total MinuteCount::total(double now) const {
  Total sum;
  if (seconds_ == nullptr) return sum;
  const std::int64_t current = secondOf(now);
  for (const Second& slot : *seconds_) {
    const std::int64_t age = current - slot.second;
    if (age < -1 || age >= static_cast<std::int64_t>(kSeconds)) continue;
    sum.events += slot.total.events;
    sum.amount += slot.total.amount;
  }
  return sum;
}

}  // namespace halvox::tools
