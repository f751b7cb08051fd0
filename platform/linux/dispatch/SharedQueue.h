#pragma once

#include <chrono>
#include <deque>
#include <functional>
#include <memory>
#include <optional>
#include <string_view>

#include "platform/dispatch.h"
#include "platform/linux/base/Mutex.h"
#include "platform/linux/dispatch/DispatchThread.h"
#include "platform/linux/dispatch/QueueLabels.h"

namespace halvox::platform::linux_ {

class DispatchPool;

// A serial queue without a thread of its own. It takes turns on the pool's threads of its quality
// of service, and its jobs can wait on semaphores without holding a thread:
//
//   idle --async()--> has a turn --no job is left--> idle
//                        |    ^
//    a job called waitOn()    resume()
//                        v    |
//                       waiting
//
// A thread that enters an idle queue (tryEnter()) also has its turn. That turn runs on the entering
// thread and not in the pool.
//
// A turn is one entry in the pool's run queue, however many jobs the queue has. A queue has at most
// one turn at a time, which makes it serial.
// Shared by its holders, its turn and its wait. Any thread may add jobs. The number of jobs has no
// bound here, because the jobs that sessions add are charged to clients. Jobs that are added after
// the pool has stopped are discarded and counted.
class SharedQueue final : public DispatchQueue, public std::enable_shared_from_this<SharedQueue> {
 public:
  SharedQueue(std::shared_ptr<DispatchPool> pool, std::string_view label, QualityOfService quality);

  // Ignores the weight, because threads of the pool may block.
  void async(JobWeight weight, Job job) override;
  // Throws std::logic_error, which makes the calling job fail, if it is called outside the jobs of
  // the queue, twice by one job, or with a semaphore of another service.
  void waitOn(std::shared_ptr<DispatchSemaphore> semaphore,
              std::optional<std::chrono::nanoseconds> timeout,
              std::function<void(WaitOutcome)> then) override;
  [[nodiscard]] bool tryEnter() override;
  void leave() override;
  [[nodiscard]] bool isCurrent() const override { return DispatchThread::current().worksFor(this); }

  // Ends the wait. The queue continues with `then`, and after it with the jobs that were added
  // during the wait.
  void resume(Job then);
  // Puts the requested turn into the pool's run queue.
  void beginTurn();
  // Discards and counts the jobs. Call after the pool has stopped.
  void discardJobs();

 private:
  // How many jobs one turn runs before other queues get their turns.
  static constexpr int kJobsPerTurn = 64;

  void askForTurn();
  void runTurn();
  [[nodiscard]] bool runNext();

  const std::shared_ptr<DispatchPool> pool_;
  QueueLabel& label_;  // owned by the pool
  const QualityOfService quality_;
  Mutex mutex_;
  std::deque<Job> jobs_ HALVOX_GUARDED_BY(mutex_);
  bool hasTurn_ HALVOX_GUARDED_BY(mutex_) = false;  // a turn is noted, queued or running
  bool isWaiting_ HALVOX_GUARDED_BY(mutex_) = false;
  // Set while a thread has entered the queue. Only that thread uses this member.
  std::optional<DispatchThread::Working> entered_;
};

}  // namespace halvox::platform::linux_
