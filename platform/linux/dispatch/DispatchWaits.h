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

// The shared queues that wait on semaphores. A wait takes no thread. It consists of an entry here
// and, if it has a time-out, a delayed job. A signal or the time-out, whichever comes first, ends
// the wait and removes the entry and the delayed job.
//
//   begin() --a signal is kept--> the queue continues
//           --none--> waiting --signal() or time-out--> the queue continues
//                             --discard()--> the queue's jobs are discarded
//
// Owned by the pool. Any thread may use it. One mutex is enough for all semaphores, because waits
// are as rare as starts and stops of sessions. There are at most as many waits as queues, because
// each queue has at most one.
class DispatchWaits {
 public:
  using Then = std::function<void(WaitOutcome)>;
  struct Wait {
    std::shared_ptr<SharedQueue> queue;
    Then then;
    std::optional<DelayedJobs::Ticket> timeout;
  };
  // Waits by their numbers. The wait with the lowest number began first.
  using Waits = std::map<std::uint64_t, Wait>;

  // `delayedJobs` and `runner` must outlive this object.
  DispatchWaits(DelayedJobs& delayedJobs, JobRunner& runner)
      : delayedJobs_(delayedJobs), runner_(runner) {}

  // Begins a wait of the queue. The queue must not run a job until its resume() is called, which
  // can happen before begin() returns.
  void begin(std::shared_ptr<SharedQueue> queue, const std::shared_ptr<SharedSemaphore>& semaphore,
             std::optional<std::chrono::nanoseconds> timeout, Then then);
  // Ends the oldest wait of the semaphore. If there is none, stores the signal.
  void signal(SharedSemaphore& semaphore);
  // Blocks the calling thread until a signal is stored, and consumes the signal. If queues wait,
  // too, they get the signals first.
  void block(SharedSemaphore& semaphore);
  // From now on no wait ends.
  void stop();
  // Destroys the waits, the objects that they hold, and the jobs of their queues. Call it after
  // stop(), when no job runs any more.
  void discard();

 private:
  void timeOut(const std::weak_ptr<SharedSemaphore>& weakSemaphore, std::uint64_t number);
  // Adds the wait, or returns its outcome if it ends at once.
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
  // The semaphores on which queues wait. This set keeps them alive.
  std::unordered_set<std::shared_ptr<SharedSemaphore>> semaphores_ HALVOX_GUARDED_BY(mutex_);
};

// A semaphore: the signals that no wait has consumed yet, or the waits for further signals. Shared
// by the code that signals and the code that waits. Any thread may use it.
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
  // The following members are guarded by the mutex of the pool's DispatchWaits. There are never
  // signals and waits at the same time.
  std::uint64_t signals_;
  DispatchWaits::Waits waits_;
  Condition signalled_;  // a signal was stored
};

}  // namespace halvox::platform::linux_
