#include "platform/linux/dispatch/PoolThreads.h"

#include <system_error>

#include "platform/linux/dispatch/ThreadPriorities.h"

namespace halvox::platform::linux_ {
namespace {

const char* threadName(QualityOfService quality) {
  switch (quality) {
    case QualityOfService::kUserInteractive:
      return "pool-urgent";
    case QualityOfService::kUtility:
      return "pool-utility";
    case QualityOfService::kBackground:
      return "pool-background";
  }
  return "pool";
}

}  // namespace

PoolThreads::~PoolThreads() {
  stop();
  join();
}

bool PoolThreads::provide() {
  if (areThere_.load(std::memory_order_relaxed)) return true;
  const MutexLock lock(mutex_);
  if (isStopped_) return false;
  try {
    while (threads_.size() < kThreads) {
      threads_.emplace_back(&PoolThreads::run, this);
      ++running_;
    }
  } catch (const std::system_error&) {
    if (threads_.empty()) return false;
  }
  // Set this even if only one thread could be started. Otherwise each job would try to start the
  // second one.
  areThere_.store(true, std::memory_order_relaxed);
  return true;
}

void PoolThreads::stop() {
  const MutexLock lock(mutex_);
  isStopped_ = true;
  context_.stop();
}

bool PoolThreads::waitForEnd(std::chrono::steady_clock::time_point deadline) {
  {
    const MutexLock lock(mutex_);
    while (running_ > 0) {
      if (!ended_.waitUntil(mutex_, deadline) && running_ > 0) return false;
    }
  }
  join();
  return true;
}

void PoolThreads::join() {
  std::vector<std::thread> threads;
  {
    const MutexLock lock(mutex_);
    // Join the threads after the lock is released, because each thread takes the lock in its last
    // step.
    threads.swap(threads_);
  }
  for (std::thread& thread : threads) thread.join();
}

void PoolThreads::discardJobs() {
  // Remove the work guard. poll() then returns when the run queue is empty.
  work_.reset();
  // A stopped context runs nothing before restart().
  context_.restart();
  context_.poll();
}

void PoolThreads::run() {
  setUpThread(threadName(quality_), priorityFor(quality_));
  context_.run();
  const MutexLock lock(mutex_);
  --running_;
  ended_.notifyAll();
}

}  // namespace halvox::platform::linux_
