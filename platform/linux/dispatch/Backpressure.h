#pragma once

#include <atomic>
#include <functional>
#include <utility>

namespace halvox::platform::linux_ {

// One bit by which a slow consumer of messages tells the readers of connections to let the busiest
// of them wait. The consumer raises and relieves it; any thread may look.
class Backpressure {
 public:
  // Set before the first thread starts. Called on the consumer's thread; must not block.
  void setReliefHandler(std::function<void()> handler) { onRelief_ = std::move(handler); }

  // Orders with nothing: a reader that sees it late reads a little more.
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
