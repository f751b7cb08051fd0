#pragma once

#include <atomic>
#include <chrono>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {

// A flag that is raised once and stays raised, such as the request to stop. A working thread can
// test it, and can wait for it together with other descriptors. Any thread may raise or test it.
// If the process has no free descriptor, waiting threads notice the flag only when their own
// time-out ends.
class WaitableFlag {
 public:
  WaitableFlag();

  // Raises the flag. Never blocks. A thread that sees the flag raised also sees everything that the
  // raising thread wrote before.
  void raise();
  [[nodiscard]] bool isRaised() const { return raised_.load(std::memory_order_acquire); }
  // Readable (poll) once the flag is raised. Owned by the flag; -1 if there is none.
  [[nodiscard]] int descriptor() const { return event_.get(); }

 private:
  std::atomic<bool> raised_{false};
  const UniqueFd event_;
};

// When a capture must end: at a point in time, or earlier when `stop` is raised. A value; copies
// are independent. Any thread may use it.
class CaptureDeadline {
 public:
  using Clock = std::chrono::steady_clock;

  // `stop` must outlive this object and its copies.
  CaptureDeadline(const WaitableFlag& stop, Clock::time_point end) : stop_(stop), end_(end) {}

  // Returns a deadline that ends `time` from now, but not later than this one.
  [[nodiscard]] CaptureDeadline within(Clock::duration time) const;
  [[nodiscard]] const WaitableFlag& stop() const { return stop_; }
  [[nodiscard]] Clock::time_point end() const { return end_; }
  [[nodiscard]] bool hasPassed() const { return stop_.isRaised() || Clock::now() >= end_; }
  // The timeout for poll(), rounded up; 0 when the deadline has passed.
  [[nodiscard]] int millisecondsLeft() const;

 private:
  const WaitableFlag& stop_;
  Clock::time_point end_;
};

}  // namespace halvox::platform::linux_
