#pragma once

#include <atomic>
#include <chrono>

#include "platform/linux/UniqueHandle.h"

namespace halvox::platform::linux_ {

// Something that happens once, such as that a thread which works for seconds shall leave off: that
// thread can look, and it can wait for it together with other descriptors. Any thread may raise the
// flag; it stays raised.
class WaitableFlag {
 public:
  WaitableFlag();

  void raise();
  // Acquires what was done before the flag was raised.
  [[nodiscard]] bool isRaised() const { return raised_.load(std::memory_order_acquire); }
  // Readable once the flag is raised.
  [[nodiscard]] int descriptor() const { return event_.get(); }

 private:
  std::atomic<bool> raised_{false};
  const UniqueFd event_;
};

// Until when a capture may go on, and who may end it before.
class Deadline {
 public:
  using Clock = std::chrono::steady_clock;

  // `stop` must outlive it.
  Deadline(const WaitableFlag& stop, Clock::time_point end) : stop_(stop), end_(end) {}

  // The same with an end that is no later than so long from now.
  [[nodiscard]] Deadline within(Clock::duration time) const;
  [[nodiscard]] const WaitableFlag& stop() const { return stop_; }
  [[nodiscard]] Clock::time_point end() const { return end_; }
  [[nodiscard]] bool hasPassed() const { return stop_.isRaised() || Clock::now() >= end_; }
  // For poll(): 0 when it has passed.
  [[nodiscard]] int millisecondsLeft() const;

 private:
  const WaitableFlag& stop_;
  Clock::time_point end_;
};

}  // namespace halvox::platform::linux_
