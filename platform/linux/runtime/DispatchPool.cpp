#include "platform/linux/runtime/DispatchPool.h"

#include <system_error>
#include <utility>

#include <asio/post.hpp>

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
  // Each handler sees the stop and lets its job go without running it.
  work_.reset();
  context_.restart();
  context_.poll();
}

void DispatchPool::run() {
  setUpThread("pool");
  context_.run();
  const MutexLock lock(mutex_);
  --running_;
  ended_.notifyAll();
}

SharedQueue::SharedQueue(std::shared_ptr<DispatchPool> pool)
    : pool_(std::move(pool)), strand_(asio::make_strand(pool_->context())) {}

void SharedQueue::async(JobWeight /*weight*/, Job job) {
  if (pool_->isStopped()) return pool_->runner().countDiscarded(1);
  asio::post(strand_, [self = shared_from_this(), job = std::move(job)] {
    if (self->pool_->isStopped()) return self->pool_->runner().countDiscarded(1);
    const JobRunner::Scope scope(self.get());
    self->pool_->runner().run(job);
  });
}

}  // namespace halvox::platform::linux_
