#include "platform/linux/dispatch/SharedQueue.h"

#include <stdexcept>
#include <utility>

#include <asio/post.hpp>

#include "platform/linux/dispatch/DispatchPool.h"

namespace halvox::platform::linux_ {
namespace {

// Counts a queue as having a turn while this object exists.
class AtWork {
 public:
  explicit AtWork(QueueLabel& label) : label_(label) {
    label_.atWork.fetch_add(1, std::memory_order_relaxed);
  }
  AtWork(const AtWork&) = delete;
  AtWork& operator=(const AtWork&) = delete;
  ~AtWork() { label_.atWork.fetch_sub(1, std::memory_order_relaxed); }

 private:
  QueueLabel& label_;
};

}  // namespace

SharedQueue::SharedQueue(std::shared_ptr<DispatchPool> pool, std::string_view label,
                         QualityOfService quality)
    : pool_(std::move(pool)), label_(pool_->labels().label(label)), quality_(quality) {}

void SharedQueue::async(JobWeight /*weight*/, Job job) {
  if (pool_->isStopped()) return pool_->runner().countDiscarded(1);
  {
    const MutexLock lock(mutex_);
    jobs_.push_back(std::move(job));
    label_.added.add();
    if (hasTurn_ || isWaiting_) return;
    hasTurn_ = true;
    // Report the turn under the lock: a pool that is asked whether it is idle must count this job's
    // turn from now on.
    pool_->beginTurn();
  }
  askForTurn();
}

bool SharedQueue::tryEnter() {
  if (pool_->isStopped()) return false;
  {
    const MutexLock lock(mutex_);
    // A turn that runs or was asked for has work that comes first.
    if (hasTurn_ || isWaiting_) return false;
    hasTurn_ = true;
    pool_->beginTurn();
  }
  label_.added.add();
  label_.atWork.fetch_add(1, std::memory_order_relaxed);
  entered_.emplace(this, label_.text);
  return true;
}

void SharedQueue::leave() {
  entered_.reset();
  label_.atWork.fetch_sub(1, std::memory_order_relaxed);
  label_.run.add();
  {
    const MutexLock lock(mutex_);
    if (jobs_.empty()) {
      hasTurn_ = false;
      pool_->endTurn();
      return;
    }
  }
  // Jobs that were added meanwhile have found a turn and did not ask for one.
  askForTurn();
}

void SharedQueue::waitOn(std::shared_ptr<DispatchSemaphore> semaphore,
                         std::optional<std::chrono::nanoseconds> timeout,
                         std::function<void(WaitOutcome)> then) {
  if (!isCurrent()) throw std::logic_error("waitOn() was called outside the jobs of its queue");
  auto shared = std::dynamic_pointer_cast<SharedSemaphore>(std::move(semaphore));
  if (shared == nullptr)
    throw std::logic_error("waitOn() needs a semaphore of its queue's service");
  if (entered_.has_value()) throw std::logic_error("waitOn() was called without a job");
  {
    const MutexLock lock(mutex_);
    if (isWaiting_) throw std::logic_error("a job called waitOn() a second time");
    isWaiting_ = true;
  }
  // Call this without the lock: a stored signal ends the wait at once, and resume() takes the lock.
  pool_->waits().begin(shared_from_this(), shared, timeout, std::move(then));
}

void SharedQueue::resume(Job then) {
  {
    const MutexLock lock(mutex_);
    // Add it in front: the job that follows the wait comes before the jobs that were added during
    // the wait.
    jobs_.push_front(std::move(then));
    label_.added.add();
    isWaiting_ = false;
    // The job that began the wait may not have returned yet. Its turn then runs `then`.
    if (hasTurn_) return;
    hasTurn_ = true;
    pool_->beginTurn();
  }
  askForTurn();
}

void SharedQueue::askForTurn() {
  DispatchThread& thread = DispatchThread::current();
  // A thread of the pool that is woken for each message costs more than the rest of the message.
  if (thread.isHoldingPool()) return thread.noteTurn(shared_from_this());
  beginTurn();
}

void SharedQueue::beginTurn() {
  if (pool_->isStopped()) return discardJobs();
  asio::post(pool_->context(quality_), [self = shared_from_this()] { self->runTurn(); });
}

void SharedQueue::runTurn() {
  const DispatchThread::Working working(this, label_.text);
  const AtWork atWork(label_);
  for (int ran = 0; ran < kJobsPerTurn; ++ran) {
    if (pool_->isStopped()) return discardJobs();
    if (!runNext()) return;
  }
  // Go back to the end of the run queue although jobs remain: other queues wait for this thread.
  beginTurn();
}

// Returns false if there is nothing to run. The turn has then ended.
bool SharedQueue::runNext() {
  Job job;
  {
    const MutexLock lock(mutex_);
    if (isWaiting_ || jobs_.empty()) {
      hasTurn_ = false;
      pool_->endTurn();
      return false;
    }
    job = std::move(jobs_.front());
    jobs_.pop_front();
  }
  pool_->runner().run(job);
  // Count after the job: a queue that is stuck in a job then has more jobs added than run.
  label_.run.add();
  return true;
}

void SharedQueue::discardJobs() {
  std::deque<Job> discarded;
  {
    const MutexLock lock(mutex_);
    if (hasTurn_) pool_->endTurn();
    hasTurn_ = false;
    // Destroyed after the lock is released: what a job holds may add jobs to this queue.
    discarded.swap(jobs_);
  }
  if (!discarded.empty()) pool_->runner().countDiscarded(discarded.size());
}

}  // namespace halvox::platform::linux_
