#pragma once

#include <cstdint>
#include <functional>
#include <map>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/base/Mutex.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// One counter with its value when it was read.
struct CounterReading {
  std::string piece;
  std::string name;
  std::uint64_t value = 0;
  friend bool operator==(const CounterReading&, const CounterReading&) = default;
};

// Owns the service's counters, by piece and name. The counters live as long as the service. Any
// thread may call; finding a counter takes a lock, adding to one does not.
class CounterStatisticsService final : public StatisticsService {
 public:
  Counter& counter(std::string_view piece, std::string_view name) override;
  void forEachCounter(const CounterCallback& callback) const override;

  // All counters, as forEachCounter() has them.
  [[nodiscard]] std::vector<CounterReading> snapshot() const;

 private:
  using CountersOfPiece = std::map<std::string, Counter, std::less<>>;

  mutable Mutex mutex_;
  // A map, because its elements do not move, and references to counters must stay valid.
  std::map<std::string, CountersOfPiece, std::less<>> counters_ HALVOX_GUARDED_BY(mutex_);
};

}  // namespace halvox::platform::linux_
