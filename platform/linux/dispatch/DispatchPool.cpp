#include "platform/linux/dispatch/DispatchPool.h"

#include <system_error>
#include <utility>

namespace halvox::platform::linux_ {

DispatchPool::DispatchPool(std::shared_ptr<JobRunner> runner, StatisticsService& statistics)
    : runner_(std::move(runner)), labels_(statistics) {
  // Start the utility threads now, because they watch the timer. The threads of other qualities
  // start when they are needed.
  if (!utility_.provide()) {
    throw std::system_error(std::make_error_code(std::errc::resource_unavailable_try_again),
                            "cannot start the threads of the queues");
  }
}

DispatchPool::~DispatchPool() {
  stop();
  static_cast<void>(waitForEnd(std::chrono::steady_clock::time_point::max()));
}

// Starts the threads of that quality if needed. A new thread begins with the priority of the thread
// that starts it. Only threads of at least utility priority start background threads, because
// utility threads watch the timer. No thread therefore begins with a lower priority than that of
// its quality.
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

void DispatchPool::stop() {
  isStopped_.store(true, std::memory_order_relaxed);
  // Stop the waits first, then the delayed jobs, then the threads. In any other order, a part that
  // still runs could give work to one that has stopped.
  waits_.stop();
  delayedJobs_.stop();
  for (PoolThreads* const threads : {&urgent_, &utility_, &background_}) threads->stop();
}

bool DispatchPool::waitForEnd(std::chrono::steady_clock::time_point deadline) {
  return urgent_.waitForEnd(deadline) && utility_.waitForEnd(deadline) &&
         background_.waitForEnd(deadline);
}

void DispatchPool::discardJobs() {
  // Each entry of the run queues sees that the pool has stopped, and destroys its jobs without
  // running them.
  for (PoolThreads* const threads : {&urgent_, &utility_, &background_}) threads->discardJobs();
  waits_.discard();
}

}  // namespace halvox::platform::linux_
