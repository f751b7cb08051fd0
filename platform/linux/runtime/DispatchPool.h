#pragma once

#include <array>
#include <atomic>
#include <chrono>
#include <memory>
#include <thread>

#include <asio/executor_work_guard.hpp>
#include <asio/io_context.hpp>

#include "platform/linux/Mutex.h"
#include "platform/linux/runtime/DelayedJobs.h"
#include "platform/linux/runtime/DispatchWaits.h"
#include "platform/linux/runtime/JobRunner.h"

namespace halvox::platform::linux_ {

// The threads that all shared queues and delayed jobs run on. Two of them, so that one job that
// waits does not hold up all others.
// Shared by the service, the shared queues and the semaphores; the service stops it.
class DispatchPool {
 public:
  // Throws std::system_error when the system has no threads to give.
  explicit DispatchPool(std::shared_ptr<JobRunner> runner);
  // Waits for the jobs that run.
  ~DispatchPool();

  [[nodiscard]] asio::io_context& context() { return context_; }
  [[nodiscard]] JobRunner& runner() { return *runner_; }
  [[nodiscard]] DelayedJobs& delayedJobs() { return delayedJobs_; }
  [[nodiscard]] DispatchWaits& waits() { return waits_; }
  // Orders with nothing: jobs that are added during the stop may go either way.
  [[nodiscard]] bool isStopped() const { return isStopped_.load(std::memory_order_relaxed); }

  // Lets the threads end after the jobs that run; discards all others, and ends no wait any more.
  void stop();
  // Waits for their end until that time; false when a job still runs then. After stop() only.
  bool waitForEnd(std::chrono::steady_clock::time_point deadline);
  // Destroys the discarded jobs and waits, which may hold the queues that hold the pool. After a
  // wait that gave true only.
  void discardJobs();

 private:
  static constexpr std::size_t kThreads = 2;

  void run();
  void end();

  const std::shared_ptr<JobRunner> runner_;
  std::atomic<bool> isStopped_{false};
  asio::io_context context_{static_cast<int>(kThreads)};
  asio::executor_work_guard<asio::io_context::executor_type> work_{context_.get_executor()};
  DelayedJobs delayedJobs_{context_, *runner_};
  DispatchWaits waits_{delayedJobs_, *runner_};
  Mutex mutex_;
  Condition ended_;
  std::size_t running_ HALVOX_GUARDED_BY(mutex_) = kThreads;
  std::array<std::thread, kThreads> threads_;  // last: they use all of the above
};

}  // namespace halvox::platform::linux_
