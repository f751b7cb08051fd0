#pragma once

#include <map>
#include <string>
#include <string_view>
#include <utility>

#include "platform/statistics.h"

namespace halvox::platform {

// Counters that start from zero for each new fake. Code under test keeps references to counters, so
// these live as long as the process; the fake remembers where each one started. Any thread may
// call. FakePlatform owns it.
class FakeStatisticsService final : public StatisticsService {
 public:
  FakeStatisticsService();

  // The count since this service was made or cleared; 0 for an unknown counter.
  [[nodiscard]] std::uint64_t value(std::string_view piece, std::string_view name) const;
  // All counters of a piece that are not 0.
  [[nodiscard]] std::map<std::string, std::uint64_t> values(std::string_view piece) const;
  // Starts from zero again.
  void clear();

  Counter& counter(std::string_view piece, std::string_view name) override;

 private:
  std::map<std::pair<std::string, std::string>, std::uint64_t> start_;
};

}  // namespace halvox::platform
