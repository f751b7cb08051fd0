#include "platform/linux/runtime/CounterStatisticsService.h"

namespace halvox::platform::linux_ {

Counter& CounterStatisticsService::counter(std::string_view piece, std::string_view name) {
  const MutexLock lock(mutex_);
  CountersOfPiece& counters = counters_.try_emplace(std::string(piece)).first->second;
  // A map, because its elements never move and callers keep references to counters for the life of
  // the service.
  return counters.try_emplace(std::string(name)).first->second;
}

void CounterStatisticsService::forEachCounter(const CounterCallback& callback) const {
  const MutexLock lock(mutex_);
  for (const auto& [piece, counters] : counters_) {
    for (const auto& [name, counter] : counters) callback(piece, name, counter.value());
  }
}

std::vector<CounterReading> CounterStatisticsService::snapshot() const {
  std::vector<CounterReading> readings;
  forEachCounter([&](std::string_view piece, std::string_view name, std::uint64_t value) {
    readings.push_back({std::string(piece), std::string(name), value});
  });
  return readings;
}

}  // namespace halvox::platform::linux_
