#pragma once

#include <map>
#include <mutex>
#include <string>
#include <string_view>
#include <utility>

#include "platform/statistics.h"

namespace halvox::platform {

// Counters that a test can read. The fake owns them. Objects that count must therefore be destroyed
// before the fake. Any thread may call. FakePlatform owns it.
class FakeStatisticsService final : public StatisticsService {
 public:
  // The count since this service was made or cleared; 0 for an unknown counter.
  [[nodiscard]] std::uint64_t value(std::string_view piece, std::string_view name) const;
  // All counters of a piece that are not 0.
  [[nodiscard]] std::map<std::string, std::uint64_t> values(std::string_view piece) const;
  // Starts from zero again, with the same counters.
  void clear();

  Counter& counter(std::string_view piece, std::string_view name) override;
  void forEachCounter(const CounterCallback& callback) const override;

 private:
  struct Count {
    Counter counter;
    std::uint64_t start = 0;  // its value at the last clear()
  };

  mutable std::mutex mutex_;
  // A map, because its elements do not move, and references to counters must stay valid.
  std::map<std::pair<std::string, std::string>, Count> counts_;
};

}  // namespace halvox::platform
