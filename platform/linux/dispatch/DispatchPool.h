#pragma once

#include <atomic>
#include <chrono>
#include <memory>

#include <asio/io_context.hpp>

#include "platform/dispatch.h"
#include "platform/linux/dispatch/DelayedJobs.h"
#include "platform/linux/dispatch/DispatchWaits.h"
#include "platform/linux/dispatch/JobRunner.h"
#include "platform/linux/dispatch/PoolThreads.h"
#include "platform/linux/dispatch/QueueLabels.h"

namespace halvox::platform::linux_ {

// The threads on which all shared queues and delayed jobs run, in one group for each quality of
// service. The utility threads start with the pool, because they watch the timer of the delayed
// jobs. The other groups start with the first job for them. If the system cannot start their
// threads, the utility threads run their jobs.
//
//   running --stop()--> stopping --waitForEnd()--> ended --discardJobs()--> empty
//
// Shared by the service, the shared queues and the semaphores, which may outlive the service. The
// service stops it. Any thread may use it.
class DispatchPool {
 public:
  // Throws std::system_error if the system has no threads left. `statistics` must outlive it.
  DispatchPool(std::shared_ptr<JobRunner> runner, StatisticsService& statistics);
  DispatchPool(const DispatchPool&) = delete;
  DispatchPool& operator=(const DispatchPool&) = delete;
  // Stops, and waits for the running jobs.
  ~DispatchPool();

  // Returns the run queue of the threads of that quality. A handler that is posted to it must
  // itself check whether the pool has stopped.
  [[nodiscard]] asio::io_context& context(QualityOfService quality);
  [[nodiscard]] JobRunner& runner() { return *runner_; }
  [[nodiscard]] OpenTurns& turns() { return runner_->turns(); }
  [[nodiscard]] QueueLabels& labels() { return labels_; }
  [[nodiscard]] DelayedJobs& delayedJobs() { return delayedJobs_; }
  [[nodiscard]] DispatchWaits& waits() { return waits_; }
  // Relaxed, because a job that is added during the stop may be run or discarded.
  [[nodiscard]] bool isStopped() const { return isStopped_.load(std::memory_order_relaxed); }

  // Lets each thread end after the job that it runs. From now on, no wait on a semaphore ends.
  void stop();
  // Waits for the end of the threads, at most until `deadline`. Returns false if a job still runs
  // then. Call after stop().
  bool waitForEnd(std::chrono::steady_clock::time_point deadline);
  // Destroys the discarded jobs and waits. Without this call, jobs and waits that hold queues would
  // keep the pool alive, because queues hold the pool. Call it after waitForEnd() has returned
  // true.
  void discardJobs();

 private:
  const std::shared_ptr<JobRunner> runner_;
  QueueLabels labels_;
  std::atomic<bool> isStopped_{false};
  PoolThreads urgent_{QualityOfService::kUserInteractive};
  PoolThreads utility_{QualityOfService::kUtility};
  PoolThreads background_{QualityOfService::kBackground};
  DelayedJobs delayedJobs_{*this};
  DispatchWaits waits_{delayedJobs_, *runner_};
};

}  // namespace halvox::platform::linux_
