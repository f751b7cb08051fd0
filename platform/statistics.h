#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <string_view>

namespace halvox::platform {

// Counts one kind of event. Any thread may add. The statistics service owns it.
class Counter {
 public:
  void add(std::uint64_t count = 1) { value_.fetch_add(count, std::memory_order_relaxed); }
  [[nodiscard]] std::uint64_t value() const { return value_.load(std::memory_order_relaxed); }

 private:
  std::atomic<std::uint64_t> value_{0};  // relaxed: no other memory is published through it
};

// Counts what the pieces of the service, such as "session", received, delivered, suppressed and
// dropped, by reason. For each piece, received = delivered + suppressed + dropped. If the sums
// differ, something was lost and not counted.
//
// Any thread may call. The composition root owns the service.
class StatisticsService {
 public:
  virtual ~StatisticsService() = default;

  // The counter of that piece and name, such as ("session", "suppressed: redundant"). The first
  // call makes it, and it lives as long as the service. Callers look a counter up once and keep the
  // reference, because a look-up takes a lock and compares names. They do not keep it in a static
  // variable, which would outlive the service. The kind of each name is in
  // counter_kinds.cpp.
  virtual Counter& counter(std::string_view piece, std::string_view name) = 0;

  // Calls `callback` for each counter, in the order of piece and name, before it returns. Each
  // value is read by itself: sums agree only while nobody counts. `callback` must not call this
  // service.
  using CounterCallback =
      std::function<void(std::string_view piece, std::string_view name, std::uint64_t value)>;
  virtual void forEachCounter(const CounterCallback& callback) const = 0;
};

}  // namespace halvox::platform
