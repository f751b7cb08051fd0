#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>
#include <memory>

#include <asio/io_context.hpp>

#include "platform/dispatch.h"
#include "platform/linux/base/Mutex.h"
#include "platform/linux/dispatch/DelayedJobs.h"
#include "platform/linux/dispatch/DispatchWaits.h"
#include "platform/linux/dispatch/JobRunner.h"
#include "platform/linux/dispatch/PoolThreads.h"
#include "platform/linux/dispatch/QueueLabels.h"

namespace halvox::platform::linux_ {

// What all shared queues and delayed jobs run on: threads for each quality of service. Those for
// utility work are there from the beginning, the others are made when there is a job for them.
// Where the system has no more threads to give, the utility threads do the others' work.
// Shared by the service, the shared queues and the semaphores; the service stops it.
class DispatchPool {
 public:
  // Throws std::system_error when the system has no threads to give. `statistics` must outlive it.
  DispatchPool(std::shared_ptr<JobRunner> runner, StatisticsService& statistics);
  DispatchPool(const DispatchPool&) = delete;
  DispatchPool& operator=(const DispatchPool&) = delete;
  // Waits for the jobs that run.
  ~DispatchPool();

  // What the threads of that quality run. The jobs that it is given must see for themselves whether
  // the pool has stopped.
  [[nodiscard]] asio::io_context& context(QualityOfService quality);
  [[nodiscard]] JobRunner& runner() { return *runner_; }
  [[nodiscard]] QueueLabels& labels() { return labels_; }
  [[nodiscard]] DelayedJobs& delayedJobs() { return delayedJobs_; }
  [[nodiscard]] DispatchWaits& waits() { return waits_; }
  // Orders with nothing: jobs that are added during the stop may go either way.
  [[nodiscard]] bool isStopped() const { return isStopped_.load(std::memory_order_relaxed); }

  // Each turn of a queue is told of: when one is to come, and when the queue has nothing left to
  // run.
  void beginTurn() { turns_.fetch_add(1); }
  void endTurn() {
    if (turns_.fetch_sub(1) == 1 && isAwaited_.load()) tellIdle();
  }
  // Waits until no queue has a job that may run now, at most until that time. Queues that wait on
  // semaphores and jobs whose time has not come are not waited for.
  void waitUntilIdle(std::chrono::steady_clock::time_point deadline);

  // Lets the threads end after the jobs that run; discards all others, and ends no wait any more.
  void stop();
  // Waits for their end until that time; false when a job still runs then. After stop() only.
  bool waitForEnd(std::chrono::steady_clock::time_point deadline);
  // Destroys the discarded jobs and waits, which may hold the queues that hold the pool. Call only
  // after waitForEnd() has returned true.
  void discardJobs();

 private:
  void tellIdle() HALVOX_EXCLUDES(mutex_);

  const std::shared_ptr<JobRunner> runner_;
  QueueLabels labels_;
  // Ordered with each other, so that the end of the last turn cannot miss whoever begins to wait.
  std::atomic<std::int64_t> turns_{0};
  std::atomic<bool> isAwaited_{false};
  Mutex mutex_;
  Condition idle_;
  std::atomic<bool> isStopped_{false};
  PoolThreads urgent_{QualityOfService::kUserInteractive};
  PoolThreads utility_{QualityOfService::kUtility};
  PoolThreads background_{QualityOfService::kBackground};
  DelayedJobs delayedJobs_{*this};
  DispatchWaits waits_{delayedJobs_, *runner_};
};

}  // namespace halvox::platform::linux_
