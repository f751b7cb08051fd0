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

// The pool's threads of one quality of service. There are two, so that one job that blocks does not
// hold up all others. They keep the scheduling priority of their quality: lowering a thread's
// priority needs no privilege, but raising it again does.
//
//   no threads --provide()--> running --stop()--> stopping --waitForEnd()--> ended
//
// Idle threads sleep without a time-out. Owned by the pool. Any thread may use it.
class PoolThreads {
 public:
  explicit PoolThreads(QualityOfService quality) : quality_(quality) {}
  PoolThreads(const PoolThreads&) = delete;
  PoolThreads& operator=(const PoolThreads&) = delete;
  // Stops, and waits for the running jobs.
  ~PoolThreads();

  // Their run queue. What is posted before there are threads waits in it.
  [[nodiscard]] asio::io_context& context() { return context_; }
  // Starts the threads unless they run. One is enough if the system refuses the second. Returns
  // false if it refuses both, and after stop(). The caller must not have a lower priority than this
  // quality: a new thread starts with the priority of the thread that makes it.
  bool provide() HALVOX_EXCLUDES(mutex_);

  // Lets the threads end after the jobs that they run.
  void stop() HALVOX_EXCLUDES(mutex_);
  // Waits for the end of the threads, at most until `deadline`. Returns false if a job still runs
  // then. Call after stop().
  bool waitForEnd(std::chrono::steady_clock::time_point deadline) HALVOX_EXCLUDES(mutex_);
  // Runs what is left in the run queue; each entry sees the stop and discards its jobs. Call after
  // waitForEnd() has returned true.
  void discardJobs();

 private:
  static constexpr std::size_t kThreads = 2;

  void run() HALVOX_EXCLUDES(mutex_);
  void join() HALVOX_EXCLUDES(mutex_);

  const QualityOfService quality_;
  asio::io_context context_{static_cast<int>(kThreads)};
  asio::executor_work_guard<asio::io_context::executor_type> work_{context_.get_executor()};
  std::atomic<bool> areThere_{false};  // relaxed: it only saves the lock
  Mutex mutex_;
  Condition ended_;
  bool isStopped_ HALVOX_GUARDED_BY(mutex_) = false;
  std::size_t running_ HALVOX_GUARDED_BY(mutex_) = 0;
  std::vector<std::thread> threads_ HALVOX_GUARDED_BY(mutex_);
};

}  // namespace halvox::platform::linux_
