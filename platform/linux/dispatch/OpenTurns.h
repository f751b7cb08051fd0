#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>

#include "platform/linux/base/Mutex.h"

namespace halvox::platform::linux_ {

// Counts the queues that have a turn, which means a job that runs or can run now. An orderly end
// waits until there are none.
//
// One count covers the shared queues and those with threads of their own, because jobs of one kind
// add jobs to the other. A queue begins the turn for an added job before the adding job has ended.
// The count therefore never drops to zero between the two, as two separate counts would.
//
// Shared by a service and all its queues. Any thread may use it.
class OpenTurns {
 public:
  // A queue calls begin() when it gets a job and has no turn, and end() when it has nothing left to
  // run. It calls both under its lock.
  void begin() { open_.fetch_add(1); }
  void end() HALVOX_EXCLUDES(mutex_) {
    if (open_.fetch_sub(1) == 1 && isAwaited_.load()) reportNone();
  }
  // Waits until no turn is open, at most until `deadline`. Does not wait for queues that wait on
  // semaphores, nor for delayed jobs that are not due. Returns false at the deadline.
  bool waitUntilNone(std::chrono::steady_clock::time_point deadline) HALVOX_EXCLUDES(mutex_);

 private:
  void reportNone() HALVOX_EXCLUDES(mutex_);

  // These two are sequentially consistent with each other: either waitUntilNone() sees that the
  // last turn has ended, or end() sees that a thread waits.
  std::atomic<std::int64_t> open_{0};
  std::atomic<bool> isAwaited_{false};
  Mutex mutex_;
  Condition none_;
};

}  // namespace halvox::platform::linux_
