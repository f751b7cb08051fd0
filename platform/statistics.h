#pragma once

#include <atomic>
#include <cstdint>
#include <string_view>

namespace halvox::platform {

// A count of one kind of thing that happened. Any thread may add.
class Counter {
 public:
  void add(std::uint64_t count = 1) { value_.fetch_add(count, std::memory_order_relaxed); }
  [[nodiscard]] std::uint64_t value() const { return value_.load(std::memory_order_relaxed); }

 private:
  std::atomic<std::uint64_t> value_{0};  // orders with nothing: it is only ever summed up
};

// The service's own bookkeeping: what was received, delivered, suppressed and dropped, by reason.
// For each piece, received = delivered + suppressed + dropped.
class StatisticsService {
 public:
  virtual ~StatisticsService() = default;

  // The counter of that piece and name, such as ("session", "suppressed: redundant"), made at the
  // first call. The service owns it; it lives as long as the process, so callers keep it.
  virtual Counter& counter(std::string_view piece, std::string_view name) = 0;
};

}  // namespace halvox::platform
