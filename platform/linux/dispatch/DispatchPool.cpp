#include "platform/linux/dispatch/DispatchPool.h"

#include <system_error>
#include <utility>

namespace halvox::platform::linux_ {

DispatchPool::DispatchPool(std::shared_ptr<JobRunner> runner, StatisticsService& statistics)
    : runner_(std::move(runner)), labels_(statistics) {
  // The utility threads watch the timer from the start. Those of other qualities are made when they
  // are needed.
  if (!utility_.provide()) {
    throw std::system_error(std::make_error_code(std::errc::resource_unavailable_try_again),
                            "cannot start the threads of the queues");
  }
}

DispatchPool::~DispatchPool() {
  stop();
  static_cast<void>(waitForEnd(std::chrono::steady_clock::time_point::max()));
}

// A new thread starts with the priority of the thread that makes it. Only threads of at least
// utility priority make background threads, because utility threads watch the timer. No thread
// therefore gets a lower priority than its quality's.
asio::io_context& DispatchPool::context(QualityOfService quality) {
  switch (quality) {
    case QualityOfService::kUserInteractive:
      return (urgent_.provide() ? urgent_ : utility_).context();
    case QualityOfService::kUtility:
      break;
    case QualityOfService::kBackground:
      return (background_.provide() ? background_ : utility_).context();
  }
  return utility_.context();
}

void DispatchPool::waitUntilIdle(std::chrono::steady_clock::time_point deadline) {
  // Set this before the first look at turns_: from here on, the last turn that ends reports it.
  isAwaited_.store(true);
  const MutexLock lock(mutex_);
  while (turns_.load() > 0 && idle_.waitUntil(mutex_, deadline)) {
  }
}

void DispatchPool::reportIdle() {
  const MutexLock lock(mutex_);
  idle_.notifyAll();
}

void DispatchPool::stop() {
  isStopped_.store(true, std::memory_order_relaxed);
  // Stop the waits first, then the timers, then the threads: each could otherwise still give work
  // to the next.
  waits_.stop();
  delayedJobs_.stop();
  for (PoolThreads* const threads : {&urgent_, &utility_, &background_}) threads->stop();
}

bool DispatchPool::waitForEnd(std::chrono::steady_clock::time_point deadline) {
  return urgent_.waitForEnd(deadline) && utility_.waitForEnd(deadline) &&
         background_.waitForEnd(deadline);
}

void DispatchPool::discardJobs() {
  // Each posted handler sees the stop and destroys its jobs without running them.
  for (PoolThreads* const threads : {&urgent_, &utility_, &background_}) threads->discardJobs();
  waits_.discard();
}

}  // namespace halvox::platform::linux_
