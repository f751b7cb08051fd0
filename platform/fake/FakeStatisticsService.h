#pragma once

#include <map>
#include <string>
#include <string_view>
#include <utility>

#include "platform/statistics.h"

namespace halvox::platform {

// Counters that count from nought for each new fake, though code under test keeps the counters that
// it once got: they live as long as the process. Any thread may call.
class FakeStatisticsService final : public StatisticsService {
 public:
  FakeStatisticsService();

  // What was counted since this service was made or cleared; 0 for an unknown counter.
  [[nodiscard]] std::uint64_t value(std::string_view piece, std::string_view name) const;
  // All counters of a piece that are not 0.
  [[nodiscard]] std::map<std::string, std::uint64_t> values(std::string_view piece) const;
  // Counts from nought again.
  void clear();

  Counter& counter(std::string_view piece, std::string_view name) override;

 private:
  std::map<std::pair<std::string, std::string>, std::uint64_t> start_;
};

}  // namespace halvox::platform
