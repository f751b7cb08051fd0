#include "platform/linux/dispatch/SharedQueue.h"

#include <stdexcept>
#include <utility>

#include <asio/post.hpp>

#include "platform/linux/dispatch/DispatchPool.h"

namespace halvox::platform::linux_ {
namespace {

// While this object exists, its label counts one more queue that has a turn.
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
    // Report the turn under the lock. From the moment when the job is in the queue, waitUntilNone()
    // must count its turn.
    pool_->turns().begin();
  }
  askForTurn();
}

bool SharedQueue::tryEnter() {
  if (pool_->isStopped()) return false;
  {
    const MutexLock lock(mutex_);
    // If the queue has a turn, or will have one after a wait, earlier jobs come first.
    if (hasTurn_ || isWaiting_) return false;
    hasTurn_ = true;
    pool_->turns().begin();
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
      pool_->turns().end();
      return;
    }
  }
  // Jobs that were added since tryEnter() did not ask for a turn, because the queue had one.
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
  // Call begin() without the lock. If a signal is stored, begin() calls resume() at once, which
  // takes the lock.
  pool_->waits().begin(shared_from_this(), shared, timeout, std::move(then));
}

void SharedQueue::resume(Job then) {
  {
    const MutexLock lock(mutex_);
    // Add `then` in front, because it comes before the jobs that were added during the wait.
    jobs_.push_front(std::move(then));
    label_.added.add();
    isWaiting_ = false;
    // The job that began the wait may still be running. Its turn then runs `then`, too.
    if (hasTurn_) return;
    hasTurn_ = true;
    pool_->turns().begin();
  }
  askForTurn();
}

void SharedQueue::askForTurn() {
  DispatchThread& thread = DispatchThread::current();
  // Only note the turn while this thread holds the pool. Waking a thread of the pool for each
  // message costs more than all other work for the message.
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
  // Jobs remain. Continue in a new turn at the end of the run queue, because other queues wait for
  // this thread.
  beginTurn();
}

// Runs one job. If there is none to run, ends the turn and returns false.
bool SharedQueue::runNext() {
  Job job;
  {
    const MutexLock lock(mutex_);
    if (isWaiting_ || jobs_.empty()) {
      hasTurn_ = false;
      pool_->turns().end();
      return false;
    }
    job = std::move(jobs_.front());
    jobs_.pop_front();
  }
  pool_->runner().run(job);
  // Count the job after it has run. A queue that is stuck in a job then has more jobs added than
  // run.
  label_.run.add();
  return true;
}

void SharedQueue::discardJobs() {
  std::deque<Job> discarded;
  {
    const MutexLock lock(mutex_);
    if (hasTurn_) pool_->turns().end();
    hasTurn_ = false;
    // Destroy the jobs after the lock is released, because the destructor of an object that a job
    // holds may add jobs to this queue.
    discarded.swap(jobs_);
  }
  if (!discarded.empty()) pool_->runner().countDiscarded(discarded.size());
}

}  // namespace halvox::platform::linux_
