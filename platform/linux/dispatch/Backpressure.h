#pragma once

#include <atomic>
#include <functional>
#include <utility>

namespace halvox::platform::linux_ {

// One bit with which a slow consumer of messages asks the connections to slow down the busiest
// clients. The consumer (the store) raises and relieves it; any thread may read it. Owned by the
// platform, which outlives the consumer and the connections.
//
//   low --raise()--> high --relieve(): calls the handler--> low
class Backpressure {
 public:
  // Sets the function that relieve() calls. Call it before the first thread starts. The handler
  // runs on the consumer's thread and must not block.
  void setReliefHandler(std::function<void()> handler) { onRelief_ = std::move(handler); }

  // Relaxed, because a connection that sees the bit late only reads a few more requests.
  [[nodiscard]] bool isHigh() const { return high_.load(std::memory_order_relaxed); }
  void raise() { high_.store(true, std::memory_order_relaxed); }
  void relieve() {
    if (high_.exchange(false, std::memory_order_relaxed) && onRelief_) onRelief_();
  }

 private:
  std::atomic<bool> high_{false};
  std::function<void()> onRelief_;
};

}  // namespace halvox::platform::linux_
