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

// One counter as it stood when it was read.
struct CounterReading {
  std::string piece;
  std::string name;
  std::uint64_t value = 0;
  friend bool operator==(const CounterReading&, const CounterReading&) = default;
};

// The service's counters, by piece and name. Any thread may call.
// Owns the counters; they live as long as it does.
class CounterStatisticsService final : public StatisticsService {
 public:
  Counter& counter(std::string_view piece, std::string_view name) override;

  // All counters in the order of piece and name. Each is read on its own, so sums agree only once
  // the threads that count stand still.
  [[nodiscard]] std::vector<CounterReading> snapshot() const;

 private:
  using CountersOfPiece = std::map<std::string, Counter, std::less<>>;

  mutable Mutex mutex_;
  // Maps keep their elements in place, so handed-out counters stay where they are.
  std::map<std::string, CountersOfPiece, std::less<>> counters_ HALVOX_GUARDED_BY(mutex_);
};

}  // namespace halvox::platform::linux_
