#include "platform/linux/dispatch/DispatchWaits.h"

#include <utility>
#include <vector>

#include "platform/linux/dispatch/DispatchPool.h"
#include "platform/linux/dispatch/DispatchThread.h"
#include "platform/linux/dispatch/SharedQueue.h"

namespace halvox::platform::linux_ {
namespace {

void resume(DispatchWaits::Wait wait, WaitOutcome outcome) {
  wait.queue->resume([then = std::move(wait.then), outcome] { then(outcome); });
}

}  // namespace

void DispatchWaits::begin(std::shared_ptr<SharedQueue> queue,
                          const std::shared_ptr<SharedSemaphore>& semaphore,
                          std::optional<std::chrono::nanoseconds> timeout, Then then) {
  Wait wait{std::move(queue), std::move(then), std::nullopt};
  std::optional<WaitOutcome> outcome;
  {
    const MutexLock lock(mutex_);
    outcome = tryEnd(semaphore, timeout, wait);
  }
  // Call resume() without our lock, because it takes the lock of the queue. If no thread holds two
  // locks at a time, the locks need no order.
  if (outcome.has_value()) resume(std::move(wait), *outcome);
}

std::optional<WaitOutcome> DispatchWaits::tryEnd(const std::shared_ptr<SharedSemaphore>& semaphore,
                                                 std::optional<std::chrono::nanoseconds> timeout,
                                                 Wait& wait) {
  // A stored signal takes precedence over a time-out of zero.
  if (!isStopped_ && semaphore->signals_ > 0) {
    --semaphore->signals_;
    return WaitOutcome::kSignalled;
  }
  if (!isStopped_ && timeout.has_value() && timeout->count() <= 0) return WaitOutcome::kTimedOut;
  const std::uint64_t number = begun_++;
  if (!isStopped_ && timeout.has_value()) {
    // Use a weak reference to the semaphore. The wait keeps the semaphore alive; the time-out of a
    // wait that has ended must not do so.
    wait.timeout = delayedJobs_.add(*timeout, QualityOfService::kUtility,
                                    [this, weakSemaphore = std::weak_ptr(semaphore), number] {
                                      timeOut(weakSemaphore, number);
                                    });
  }
  semaphore->waits_.emplace(number, std::move(wait));
  semaphores_.insert(semaphore);
  return std::nullopt;
}

void DispatchWaits::signal(SharedSemaphore& semaphore) {
  Wait wait;
  {
    const MutexLock lock(mutex_);
    if (isStopped_) return;
    if (semaphore.waits_.empty()) {
      ++semaphore.signals_;
      semaphore.signalled_.notifyOne();
      return;
    }
    wait = take(semaphore, semaphore.waits_.begin());
  }
  resume(std::move(wait), WaitOutcome::kSignalled);
}

void DispatchWaits::block(SharedSemaphore& semaphore) {
  const MutexLock lock(mutex_);
  while (semaphore.signals_ == 0) semaphore.signalled_.wait(mutex_);
  --semaphore.signals_;
}

void DispatchWaits::timeOut(const std::weak_ptr<SharedSemaphore>& weakSemaphore,
                            std::uint64_t number) {
  const auto semaphore = weakSemaphore.lock();
  if (semaphore == nullptr) return;
  Wait wait;
  {
    const MutexLock lock(mutex_);
    // The wait may be gone: a signal may have ended it after the time-out became due.
    const auto place = semaphore->waits_.find(number);
    if (isStopped_ || place == semaphore->waits_.end()) return;
    wait = take(*semaphore, place);
  }
  resume(std::move(wait), WaitOutcome::kTimedOut);
}

// The caller must hold a shared pointer to the semaphore. Removing the last wait may otherwise
// destroy the semaphore.
DispatchWaits::Wait DispatchWaits::take(SharedSemaphore& semaphore, Waits::iterator place) {
  Wait wait = std::move(place->second);
  semaphore.waits_.erase(place);
  if (wait.timeout.has_value()) delayedJobs_.cancel(*wait.timeout);
  if (semaphore.waits_.empty()) semaphores_.erase(semaphore.shared_from_this());
  return wait;
}

void DispatchWaits::stop() {
  const MutexLock lock(mutex_);
  isStopped_ = true;
  for (const auto& semaphore : semaphores_) {
    for (auto& [number, wait] : semaphore->waits_) {
      if (wait.timeout.has_value()) delayedJobs_.cancel(*wait.timeout);
      wait.timeout.reset();
    }
  }
}

void DispatchWaits::discard() {
  std::vector<Wait> discarded;
  std::unordered_set<std::shared_ptr<SharedSemaphore>> semaphores;
  {
    const MutexLock lock(mutex_);
    semaphores.swap(semaphores_);
    for (const auto& semaphore : semaphores) {
      for (auto& [number, wait] : semaphore->waits_) discarded.push_back(std::move(wait));
      semaphore->waits_.clear();
    }
  }
  // `discarded` and `semaphores` are destroyed without the lock, because the objects that they hold
  // may signal in their destructors.
  runner_.countDiscarded(discarded.size());
  for (const Wait& wait : discarded) wait.queue->discardJobs();
}

void SharedSemaphore::signal() { pool_->waits().signal(*this); }

void SharedSemaphore::wait() {
  const DispatchThread::Waiting waiting;
  pool_->waits().block(*this);
}

}  // namespace halvox::platform::linux_
