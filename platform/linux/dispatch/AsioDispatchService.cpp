#include "platform/linux/dispatch/AsioDispatchService.h"

#include <algorithm>
#include <iterator>
#include <string>
#include <system_error>
#include <utility>

#include "platform/linux/dispatch/DispatchPool.h"
#include "platform/linux/dispatch/DispatchThread.h"
#include "platform/linux/dispatch/JobRunner.h"
#include "platform/linux/dispatch/OwnThreadQueue.h"
#include "platform/linux/dispatch/SharedQueue.h"

namespace halvox::platform::linux_ {

AsioDispatchService::AsioDispatchService(LogService& log, StatisticsService& statistics)
    : log_(log.createCategory("com.tarno.halvox", "dispatch")),
      runner_(std::make_shared<JobRunner>(log, statistics)),
      pool_(std::make_shared<DispatchPool>(runner_, statistics)) {}

// A year stands for "no limit". The largest duration cannot be used, because adding it to the
// current time would overflow.
AsioDispatchService::~AsioDispatchService() { stop(std::chrono::hours(24 * 365)); }

std::shared_ptr<DispatchQueue> AsioDispatchService::createSerialQueue(std::string_view label,
                                                                      QualityOfService quality,
                                                                      QueueThreading threading) {
  if (threading == QueueThreading::kOwnThread) {
    if (auto queue = createOwnThreadQueue(label, quality)) return queue;
  }
  return std::make_shared<SharedQueue>(pool_, label, quality);
}

std::shared_ptr<DispatchSemaphore> AsioDispatchService::createSemaphore(std::uint64_t signals) {
  return std::make_shared<SharedSemaphore>(pool_, signals);
}

void AsioDispatchService::asyncAfterOnBackgroundQueue(std::chrono::nanoseconds delay, Job job) {
  pool_->delayedJobs().add(delay, QualityOfService::kBackground, std::move(job));
}

void AsioDispatchService::beginHelping() { DispatchThread::current().beginHelping(); }

void AsioDispatchService::endHelping() { DispatchThread::current().endHelping(); }

void AsioDispatchService::holdPool() { DispatchThread::current().holdPool(); }

void AsioDispatchService::wakePool() { DispatchThread::current().wakePool(); }

std::uint64_t AsioDispatchService::finish(const FinishLimits& limits) {
  wakePool();  // starts the turns that this thread still holds back
  // The timer may have expired, but its thread may not have started the jobs yet.
  pool_->delayedJobs().startDue();
  const auto end = std::chrono::steady_clock::now() + limits.total;
  QueueLabels::Jobs before = jobs();
  while (true) {
    const auto now = std::chrono::steady_clock::now();
    if (pool_->turns().waitUntilNone(std::min(now + limits.withoutProgress, end))) return 0;
    const QueueLabels::Jobs after = jobs();
    if (after.run == before.run || std::chrono::steady_clock::now() >= end) {
      return after.added - after.run;
    }
    before = after;
  }
}

QueueLabels::Jobs AsioDispatchService::jobs() {
  QueueLabels::Jobs sum = pool_->labels().jobs();
  const QueueLabels::Jobs delayed = pool_->delayedJobs().dueJobs();
  sum.run += delayed.run;
  sum.added += delayed.added;
  const MutexLock lock(mutex_);
  for (const auto& queue : ownThreadQueues_) {
    const QueueLabels::Jobs jobs = queue->jobs();
    sum.run += jobs.run;
    sum.added += jobs.added;
  }
  return sum;
}

bool AsioDispatchService::hasProgressed(std::string_view label) {
  const MutexLock lock(mutex_);
  bool hasProgressed = true;
  for (const auto& queue : ownThreadQueues_) {
    // Ask each queue, because each notes what it has done so far.
    if (queue->label() == label && !queue->hasProgressed()) hasProgressed = false;
  }
  return hasProgressed;
}

bool AsioDispatchService::stop(std::chrono::milliseconds limit) {
  const auto deadline = std::chrono::steady_clock::now() + limit;
  std::vector<std::shared_ptr<OwnThreadQueue>> queues;
  {
    const MutexLock lock(mutex_);
    isStopped_ = true;
    // Copy the list, to wait for the queues without the lock. A running job that makes a queue
    // needs the lock, and would otherwise never end.
    queues = ownThreadQueues_;
  }
  for (const auto& queue : queues) queue->stop();
  pool_->stop();
  std::vector<std::string> stuck;
  for (const auto& queue : queues) {
    if (!queue->waitForEnd(deadline)) stuck.push_back(queue->label());
  }
  const bool hasPoolEnded = pool_->waitForEnd(deadline);
  if (!hasPoolEnded || !stuck.empty()) {
    std::ranges::move(pool_->labels().atWork(), std::back_inserter(stuck));
    logStuck(stuck);
    return false;
  }
  // Destroy the discarded jobs only now that no job runs any more. A running job may use objects
  // that they hold.
  pool_->discardJobs();
  const MutexLock lock(mutex_);
  ownThreadQueues_.clear();
  return true;
}

void AsioDispatchService::logStuck(const std::vector<std::string>& labels) {
  std::string text =
      "jobs did not end within the time limit of the stop; ending without them. Queues:";
  for (const std::string& label : labels) text += " \"" + label + "\"";
  if (labels.empty()) text += " the background queue";
  log_.write(LogLevel::kError, detail::logPrefix("AsioDispatchService", __LINE__) + text);
}

// Returns null if the system cannot start a thread or the service has stopped. The caller then
// makes a shared queue, whose pool discards the jobs if the service has stopped.
std::shared_ptr<DispatchQueue> AsioDispatchService::createOwnThreadQueue(std::string_view label,
                                                                         QualityOfService quality) {
  const MutexLock lock(mutex_);
  if (isStopped_) return nullptr;
  std::erase_if(ownThreadQueues_, [](const auto& queue) { return queue->hasEnded(); });
  try {
    auto queue = OwnThreadQueue::start(std::string(label), quality, runner_);
    ownThreadQueues_.push_back(queue);
    // When the last holder releases the returned pointer, the queue is closed but not destroyed. It
    // stays in the list until its thread has ended: the last holder may be a job of the queue, and
    // the thread that runs this job cannot join itself.
    DispatchQueue* const face = queue.get();
    return {face, [queue = std::move(queue)](DispatchQueue*) { queue->close(); }};
  } catch (const std::system_error& error) {
    log_.write(LogLevel::kError, detail::logPrefix("AsioDispatchService", __LINE__) +
                                     "cannot start a thread for queue \"" + std::string(label) +
                                     "\" (" + error.what() + "); its jobs run on the pool");
    return nullptr;
  }
}

}  // namespace halvox::platform::linux_
