#include "platform/fake/FakeStatisticsService.h"

#include <mutex>

namespace halvox::platform {
namespace {

using Name = std::pair<std::string, std::string>;

struct Registry {
  std::mutex mutex;
  std::map<Name, Counter> counters;
};

Registry& registry() {
  // Never destroyed: objects with static storage may still count.
  static auto* instance = new Registry;
  return *instance;
}

}  // namespace

FakeStatisticsService::FakeStatisticsService() { clear(); }

std::uint64_t FakeStatisticsService::value(std::string_view piece, std::string_view name) const {
  const std::map<std::string, std::uint64_t> all = values(piece);
  const auto found = all.find(std::string(name));
  return found == all.end() ? 0 : found->second;
}

std::map<std::string, std::uint64_t> FakeStatisticsService::values(std::string_view piece) const {
  const std::lock_guard lock(registry().mutex);
  std::map<std::string, std::uint64_t> result;
  for (const auto& [name, counter] : registry().counters) {
    if (name.first != piece) continue;
    const auto start = start_.find(name);
    const std::uint64_t count = counter.value() - (start == start_.end() ? 0 : start->second);
    if (count != 0) result.emplace(name.second, count);
  }
  return result;
}

void FakeStatisticsService::clear() {
  const std::lock_guard lock(registry().mutex);
  start_.clear();
  for (const auto& [name, counter] : registry().counters) start_.emplace(name, counter.value());
}

Counter& FakeStatisticsService::counter(std::string_view piece, std::string_view name) {
  const std::lock_guard lock(registry().mutex);
  return registry().counters[{std::string(piece), std::string(name)}];
}

}  // namespace halvox::platform
