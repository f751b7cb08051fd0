#include "platform/linux/runtime/DispatchPool.h"

#include <system_error>
#include <utility>

#include "platform/linux/runtime/ThreadSetup.h"

namespace halvox::platform::linux_ {

DispatchPool::DispatchPool(std::shared_ptr<JobRunner> runner) : runner_(std::move(runner)) {
  try {
    for (std::thread& thread : threads_) thread = std::thread(&DispatchPool::run, this);
  } catch (const std::system_error&) {
    end();
    throw;
  }
}

DispatchPool::~DispatchPool() { end(); }

void DispatchPool::stop() {
  isStopped_.store(true, std::memory_order_relaxed);
  waits_.stop();
  delayedJobs_.stop();
  context_.stop();
}

bool DispatchPool::waitForEnd(std::chrono::steady_clock::time_point deadline) {
  {
    const MutexLock lock(mutex_);
    while (running_ > 0) {
      if (!ended_.waitUntil(mutex_, deadline) && running_ > 0) return false;
    }
  }
  end();
  return true;
}

void DispatchPool::end() {
  stop();
  for (std::thread& thread : threads_) {
    if (thread.joinable()) thread.join();
  }
}

void DispatchPool::discardJobs() {
  // Each handler sees the stop and lets its jobs go without running them.
  work_.reset();
  context_.restart();
  context_.poll();
  waits_.discard();
}

void DispatchPool::run() {
  setUpThread("pool");
  context_.run();
  const MutexLock lock(mutex_);
  --running_;
  ended_.notifyAll();
}

}  // namespace halvox::platform::linux_
