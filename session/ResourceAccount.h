#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>

#include "platform/connection.h"

namespace halvox {

// What one client's sessions hold at this moment. Shared by the client object, which counts its
// sessions, and by the sessions, which add and take away what they keep. Any thread may use it.
class ResourceAccount {
 public:
  void addBytes(std::size_t bytes) { bytes_.fetch_add(bytes, std::memory_order_relaxed); }
  void removeBytes(std::size_t bytes) { bytes_.fetch_sub(bytes, std::memory_order_relaxed); }
  void setSessions(std::size_t sessions) { sessions_.store(sessions, std::memory_order_relaxed); }

  [[nodiscard]] platform::ResourceUse use() const {
    return {.bytes = bytes_.load(std::memory_order_relaxed),
            .sessions = sessions_.load(std::memory_order_relaxed)};
  }

 private:
  // They order with nothing: a reader that is a little late only lets one more request in.
  std::atomic<std::uint64_t> bytes_{0};
  std::atomic<std::uint64_t> sessions_{0};
};

}  // namespace halvox
