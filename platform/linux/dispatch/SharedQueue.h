#pragma once

#include <chrono>
#include <deque>
#include <functional>
#include <memory>
#include <optional>
#include <string_view>

#include "platform/dispatch.h"
#include "platform/linux/base/Mutex.h"
#include "platform/linux/dispatch/JobRunner.h"
#include "platform/linux/dispatch/QueueLabels.h"

namespace halvox::platform::linux_ {

class DispatchPool;

// A serial queue on the pool, whose jobs can wait on semaphores. Takes turns on the pool's threads
// of its quality:
//
//   idle --a job comes--> has a turn --no job is left--> idle
//                            |    ^
//           a job began a wait    resume()
//                            v    |
//                           waiting
//
// Shared by its holders, its turn and its wait.
class SharedQueue final : public DispatchQueue, public std::enable_shared_from_this<SharedQueue> {
 public:
  SharedQueue(std::shared_ptr<DispatchPool> pool, std::string_view label, QualityOfService quality);

  void async(JobWeight weight, Job job) override;
  // Throws std::logic_error, which fails the job, when called outside the jobs of the queue, twice
  // by one, or with a semaphore of another service.
  void waitOn(std::shared_ptr<DispatchSemaphore> semaphore,
              std::optional<std::chrono::nanoseconds> timeout,
              std::function<void(WaitOutcome)> then) override;
  [[nodiscard]] bool isCurrent() const override { return JobRunner::isCurrent(this); }

  // Ends the wait: the queue goes on with this job, then with those that came meanwhile.
  void resume(Job then);
  // Lets the pool run the jobs of the turn that is to come.
  void beginTurn();
  // Discards and counts the jobs that wait. When the pool has stopped.
  void discardJobs();

 private:
  // The jobs that one turn runs before other queues get theirs.
  static constexpr int kJobsPerTurn = 64;

  void askForTurn();
  void runTurn();
  [[nodiscard]] bool runNext();

  const std::shared_ptr<DispatchPool> pool_;
  QueueLabel& label_;  // owned by the pool
  const QualityOfService quality_;
  Mutex mutex_;
  std::deque<Job> jobs_ HALVOX_GUARDED_BY(mutex_);
  bool hasTurn_ HALVOX_GUARDED_BY(mutex_) = false;  // one is to come or under way
  bool isWaiting_ HALVOX_GUARDED_BY(mutex_) = false;
};

}  // namespace halvox::platform::linux_
