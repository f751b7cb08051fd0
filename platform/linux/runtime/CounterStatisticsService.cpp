#include "platform/linux/runtime/CounterStatisticsService.h"

namespace halvox::platform::linux_ {

Counter& CounterStatisticsService::counter(std::string_view piece, std::string_view name) {
  const MutexLock lock(mutex_);
  CountersOfPiece& counters = counters_.try_emplace(std::string(piece)).first->second;
  // A map, because its elements never move and callers keep references to counters for the life of
  // the service.
  return counters.try_emplace(std::string(name)).first->second;
}

std::vector<CounterReading> CounterStatisticsService::snapshot() const {
  const MutexLock lock(mutex_);
  std::vector<CounterReading> readings;
  for (const auto& [piece, counters] : counters_) {
    for (const auto& [name, counter] : counters) readings.push_back({piece, name, counter.value()});
  }
  return readings;
}

}  // namespace halvox::platform::linux_
