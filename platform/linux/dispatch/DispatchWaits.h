#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <unordered_set>
#include <utility>

#include "platform/dispatch.h"
#include "platform/linux/base/Mutex.h"
#include "platform/linux/dispatch/DelayedJobs.h"
#include "platform/linux/dispatch/JobRunner.h"

namespace halvox::platform::linux_ {

class DispatchPool;
class SharedQueue;
class SharedSemaphore;

// The queues of a pool that wait on semaphores. A wait is an entry here and, with a time-out, one
// of the delayed jobs; it has no thread, and what ends it first takes both away.
//
//   begin() --a signal is there--> queue goes on
//           --none--> waiting --signal() or time-out--> queue goes on
//                             --discard()--> the queue's jobs are discarded
//
// Any thread may call. `delayedJobs` and `runner` must outlive it. Has no bound: each queue waits
// once.
class DispatchWaits {
 public:
  using Then = std::function<void(WaitOutcome)>;
  struct Wait {
    std::shared_ptr<SharedQueue> queue;
    Then then;
    std::optional<DelayedJobs::Ticket> timeout;
  };
  // In the order in which they began.
  using Waits = std::map<std::uint64_t, Wait>;

  DispatchWaits(DelayedJobs& delayedJobs, JobRunner& runner)
      : delayedJobs_(delayedJobs), runner_(runner) {}

  // The queue must run no job from now on until its resume() was called, which may happen within.
  void begin(std::shared_ptr<SharedQueue> queue, const std::shared_ptr<SharedSemaphore>& semaphore,
             std::optional<std::chrono::nanoseconds> timeout, Then then);
  // Ends the wait that began first, or keeps the signal.
  void signal(SharedSemaphore& semaphore);
  // Blocks this thread until there is a signal that no wait of a queue took.
  void block(SharedSemaphore& semaphore);
  // No wait begins or ends from now on.
  void stop();
  // Destroys the waits with what they hold, and the jobs of their queues. After stop(), when no job
  // runs any more.
  void discard();

 private:
  void timeOut(const std::weak_ptr<SharedSemaphore>& weakSemaphore, std::uint64_t number);
  // Adds the wait, unless it ends at once: then what it came to.
  std::optional<WaitOutcome> tryEnd(const std::shared_ptr<SharedSemaphore>& semaphore,
                                    std::optional<std::chrono::nanoseconds> timeout, Wait& wait)
      HALVOX_REQUIRES(mutex_);
  [[nodiscard]] Wait take(SharedSemaphore& semaphore, Waits::iterator place)
      HALVOX_REQUIRES(mutex_);

  DelayedJobs& delayedJobs_;
  JobRunner& runner_;
  Mutex mutex_;
  bool isStopped_ HALVOX_GUARDED_BY(mutex_) = false;
  std::uint64_t begun_ HALVOX_GUARDED_BY(mutex_) = 0;
  // Those that are waited on; the waits keep them.
  std::unordered_set<std::shared_ptr<SharedSemaphore>> semaphores_ HALVOX_GUARDED_BY(mutex_);
};

// The signals that nobody consumed yet and the waits for the next ones.
class SharedSemaphore final : public DispatchSemaphore,
                              public std::enable_shared_from_this<SharedSemaphore> {
 public:
  SharedSemaphore(std::shared_ptr<DispatchPool> pool, std::uint64_t signals)
      : pool_(std::move(pool)), signals_(signals) {}

  void signal() override;
  void wait() override;

 private:
  friend class DispatchWaits;

  const std::shared_ptr<DispatchPool> pool_;
  // Both under the mutex of the pool's DispatchWaits; never both more than nothing.
  std::uint64_t signals_;
  DispatchWaits::Waits waits_;
  Condition signalled_;  // a signal was kept
};

}  // namespace halvox::platform::linux_
