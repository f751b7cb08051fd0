#include "platform/fake/FakeStatisticsService.h"

namespace halvox::platform {

std::uint64_t FakeStatisticsService::value(std::string_view piece, std::string_view name) const {
  const std::map<std::string, std::uint64_t> all = values(piece);
  const auto found = all.find(std::string(name));
  return found == all.end() ? 0 : found->second;
}

std::map<std::string, std::uint64_t> FakeStatisticsService::values(std::string_view piece) const {
  const std::lock_guard lock(mutex_);
  std::map<std::string, std::uint64_t> result;
  for (const auto& [name, count] : counts_) {
    if (name.first != piece) continue;
    const std::uint64_t value = count.counter.value() - count.start;
    if (value != 0) result.emplace(name.second, value);
  }
  return result;
}

void FakeStatisticsService::clear() {
  const std::lock_guard lock(mutex_);
  for (auto& [name, count] : counts_) count.start = count.counter.value();
}

Counter& FakeStatisticsService::counter(std::string_view piece, std::string_view name) {
  const std::lock_guard lock(mutex_);
  return counts_[{std::string(piece), std::string(name)}].counter;
}

void FakeStatisticsService::forEachCounter(const CounterCallback& callback) const {
  const std::lock_guard lock(mutex_);
  for (const auto& [name, count] : counts_) {
    callback(name.first, name.second, count.counter.value() - count.start);
  }
}

}  // namespace halvox::platform
