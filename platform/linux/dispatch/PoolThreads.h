#pragma once

#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <thread>
#include <vector>

#include <asio/executor_work_guard.hpp>
#include <asio/io_context.hpp>

#include "platform/dispatch.h"
#include "platform/linux/base/Mutex.h"

namespace halvox::platform::linux_ {

// The pool's threads of one quality of service, which run at its scheduling priority. Two of them,
// so that one job that waits does not hold up all others. A thread stays at its priority for good:
// lowering it needs no privilege, but raising it again does. So each quality has threads of its
// own.
//
//   without threads --provide()--> serving --stop()--> stopped, waitForEnd() --> ended
//
// Threads that have nothing to do sleep without a timer. Any thread may call. Belongs to the pool.
class PoolThreads {
 public:
  explicit PoolThreads(QualityOfService quality) : quality_(quality) {}
  PoolThreads(const PoolThreads&) = delete;
  PoolThreads& operator=(const PoolThreads&) = delete;
  // Waits for the jobs that run.
  ~PoolThreads();

  // What they run; jobs that are added to it without threads stay there.
  [[nodiscard]] asio::io_context& context() { return context_; }
  // Makes the threads unless they are there; false when the system has none to give. The calling
  // thread must not be of a lower priority: new threads begin with that of their maker.
  bool provide() HALVOX_EXCLUDES(mutex_);

  // Lets the threads end after the jobs that run.
  void stop() HALVOX_EXCLUDES(mutex_);
  // Waits for their end until that time; false when a job still runs then. After stop() only.
  bool waitForEnd(std::chrono::steady_clock::time_point deadline) HALVOX_EXCLUDES(mutex_);
  // Lets the jobs see the stop that did not run. Call only after waitForEnd() has returned true.
  void discardJobs();

 private:
  static constexpr std::size_t kThreads = 2;

  void run() HALVOX_EXCLUDES(mutex_);
  void join() HALVOX_EXCLUDES(mutex_);

  const QualityOfService quality_;
  asio::io_context context_{static_cast<int>(kThreads)};
  asio::executor_work_guard<asio::io_context::executor_type> work_{context_.get_executor()};
  std::atomic<bool> areThere_{false};  // orders with nothing: saves the lock
  Mutex mutex_;
  Condition ended_;
  bool isStopped_ HALVOX_GUARDED_BY(mutex_) = false;
  std::size_t running_ HALVOX_GUARDED_BY(mutex_) = 0;
  std::vector<std::thread> threads_ HALVOX_GUARDED_BY(mutex_);
};

}  // namespace halvox::platform::linux_
