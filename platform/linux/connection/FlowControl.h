#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>

#include "platform/linux/connection/ConnectionLimits.h"

namespace halvox::platform::linux_ {

// Counts the open requests of one client. While too many are open, the service does not read from
// the client. A flood of requests then slows down only the client that sends it, and memory stays
// bounded. ConnectionLimits.h has the bounds.
//
//   below --open()--> full --wait()--> waiting --close() reaches half--> below, the reader is woken
//
// The I/O thread calls open() and wait(); any thread calls close(). Owned by the client's link.
class FlowControl {
 public:
  // What one request adds to the number and the bytes of open requests.
  struct Cost {
    std::size_t requests = 1;
    std::size_t bytes = 0;
  };

  void open(Cost cost) { open_.fetch_add(packed(cost), std::memory_order_relaxed); }

  // Returns true if the reader waits and at most half of the bounds is used now. The caller must
  // then wake the reader. If several threads call close() at once, only one of them gets true.
  [[nodiscard]] bool close(Cost cost) {
    // Sequentially consistent with wait(): of a close() and a wait() at the same time, the later
    // one sees what the earlier one did. No wake-up is lost, and the reader cannot wait forever.
    const std::uint64_t left = open_.fetch_sub(packed(cost)) - packed(cost);
    return hasRoomAgain(left) && waiting_.load() && waiting_.exchange(false);
  }

  [[nodiscard]] bool isFull() const {
    const std::uint64_t open = open_.load(std::memory_order_relaxed);
    return requestsIn(open) >= kMaxOpenRequests || bytesIn(open) >= kMaxOpenRequestBytes;
  }

  // Asks close() for a wake-up when half of the bounds is free. Returns false if half is free
  // already.
  [[nodiscard]] bool wait() {
    waiting_.store(true);
    return !(hasRoomAgain(open_.load()) && waiting_.exchange(false));
  }

  [[nodiscard]] std::size_t openRequests() const { return requestsIn(open_.load()); }

 private:
  // Both sums are in one word, because one atomic operation must change both. The low 24 bits are
  // the number of requests, the other bits are the bytes. The bounds keep both sums far below what
  // their bits can hold.
  static constexpr unsigned kRequestBits = 24;

  static std::uint64_t packed(Cost cost) {
    return (std::uint64_t{cost.bytes} << kRequestBits) | cost.requests;
  }
  static std::size_t requestsIn(std::uint64_t open) {
    return open & ((std::uint64_t{1} << kRequestBits) - 1);
  }
  static std::size_t bytesIn(std::uint64_t open) { return open >> kRequestBits; }
  static bool hasRoomAgain(std::uint64_t open) {
    return requestsIn(open) <= kMaxOpenRequests / 2 && bytesIn(open) <= kMaxOpenRequestBytes / 2;
  }

  std::atomic<std::uint64_t> open_{0};
  std::atomic<bool> waiting_{false};
};

}  // namespace halvox::platform::linux_
