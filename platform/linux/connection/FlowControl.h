#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>

#include "platform/linux/connection/ConnectionLimits.h"

namespace halvox::platform::linux_ {

// Counts what one client has open, so that its reader can wait until the client's requests are
// carried out. The reader's thread opens and waits; any thread closes.
class FlowControl {
 public:
  // What one request counts as.
  struct Cost {
    std::size_t requests = 1;
    std::size_t bytes = 0;
  };

  void open(Cost cost) { open_.fetch_add(packed(cost), std::memory_order_relaxed); }

  // True when the reader waits and has room now: the caller must wake it, once.
  [[nodiscard]] bool close(Cost cost) {
    // The order of this and of wait() matters: the one that comes second sees what the first did.
    const std::uint64_t left = open_.fetch_sub(packed(cost)) - packed(cost);
    return hasRoomAgain(left) && waiting_.load() && waiting_.exchange(false);
  }

  [[nodiscard]] bool isFull() const {
    const std::uint64_t open = open_.load(std::memory_order_relaxed);
    return requestsIn(open) >= kMaxOpenRequests || bytesIn(open) >= kMaxOpenRequestBytes;
  }

  // Asks to be woken when there is room again. False when there is by now.
  [[nodiscard]] bool wait() {
    waiting_.store(true);
    return !(hasRoomAgain(open_.load()) && waiting_.exchange(false));
  }

  [[nodiscard]] std::size_t openRequests() const { return requestsIn(open_.load()); }

 private:
  // One word for both sums: the requests in the low bits, the bytes above.
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
