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

// The pool's threads of one quality of service. There are two threads, because with one thread a
// job that blocks would hold up all others. They always keep the scheduling priority of their
// quality: lowering a thread's priority needs no privilege, but raising it again does.
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

  // Returns the run queue of the threads. Jobs that are posted before the threads start wait in it.
  [[nodiscard]] asio::io_context& context() { return context_; }
  // Starts the threads unless they run. If the system refuses the second thread, one is enough.
  // Returns false if the system refuses both, or after stop(). The calling thread must not have a
  // lower priority than this quality, because a new thread starts with the priority of the thread
  // that makes it.
  bool provide() HALVOX_EXCLUDES(mutex_);

  // Lets each thread end after the job that it runs.
  void stop() HALVOX_EXCLUDES(mutex_);
  // Waits for the end of the threads, at most until `deadline`. Returns false if a job still runs
  // then. Call after stop().
  bool waitForEnd(std::chrono::steady_clock::time_point deadline) HALVOX_EXCLUDES(mutex_);
  // Runs the remaining entries of the run queue. Each entry sees that the pool has stopped, and
  // discards its jobs. Call it after waitForEnd() has returned true.
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
