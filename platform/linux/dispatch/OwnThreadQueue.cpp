#include "platform/linux/dispatch/OwnThreadQueue.h"

#include <ctime>
#include <stdexcept>
#include <utility>

#include <pthread.h>

#include "platform/linux/dispatch/ThreadPriorities.h"

namespace halvox::platform::linux_ {
namespace {

// The number of jobs for which an idle queue keeps memory. A queue that once had more jobs frees
// the rest.
constexpr std::size_t kKeptCapacity = 4096;

}  // namespace

std::shared_ptr<OwnThreadQueue> OwnThreadQueue::start(std::string label, QualityOfService quality,
                                                      std::shared_ptr<JobRunner> runner) {
  std::shared_ptr<OwnThreadQueue> queue(
      new OwnThreadQueue(std::move(label), quality, std::move(runner)));
  queue->thread_ = std::thread(&OwnThreadQueue::run, queue.get());
  return queue;
}

OwnThreadQueue::OwnThreadQueue(std::string label, QualityOfService quality,
                               std::shared_ptr<JobRunner> runner)
    : label_(std::move(label)), quality_(quality), runner_(std::move(runner)) {}

OwnThreadQueue::~OwnThreadQueue() {
  stop();
  if (thread_.joinable()) thread_.join();
}

void OwnThreadQueue::async(JobWeight weight, Job job) {
  DispatchThread& helper = DispatchThread::current();
  const bool mayHelp = weight == JobWeight::kBrief && helper.isHelping();
  bool isNewForHelper = false;
  bool mustWake = false;
  {
    const MutexLock lock(mutex_);
    if (life_ == Life::kStopped) {
      runner_->countDiscarded(1);
      return;  // the job is destroyed with the arguments, after the lock has been released
    }
    waiting_.push_back({std::move(job), weight});
    ++added_;
    // Under the lock: from the moment when the job is in the queue, its turn must count.
    if (!std::exchange(hasTurn_, true)) runner_->turns().begin();
    if (hasWorker_) return;  // the worker looks for new jobs before it stops working
    // The helper has noted this queue already and will find the job.
    if (mayHelp && helper_ == &helper) return;
    // A queue has only one helper at a time. If a second thread adds a job, wake the own thread.
    isNewForHelper = mayHelp && helper_ == nullptr;
    if (isNewForHelper) {
      helper_ = &helper;
    } else {
      mustWake = takeWakeUp();
    }
  }
  // Do this after the lock is released, because a thread that wakes up needs the lock at once.
  if (isNewForHelper) helper.noteQueueToHelp(shared_from_this());
  if (mustWake) wakeUp_.notifyOne();
}

void OwnThreadQueue::waitOn(std::shared_ptr<DispatchSemaphore> /*semaphore*/,
                            std::optional<std::chrono::nanoseconds> /*timeout*/,
                            std::function<void(WaitOutcome)> /*then*/) {
  throw std::logic_error("waitOn() was called on a queue with a thread of its own");
}

void OwnThreadQueue::close() {
  const MutexLock lock(mutex_);
  if (life_ == Life::kOpen) life_ = Life::kClosed;
  wakeUp_.notifyOne();
}

void OwnThreadQueue::stop() {
  std::vector<Item> discarded;
  {
    const MutexLock lock(mutex_);
    life_ = Life::kStopped;
    isStopped_.store(true, std::memory_order_relaxed);
    // Destroy the jobs after the lock is released, because the destructor of an object that a job
    // holds may add jobs to this queue.
    discarded.swap(waiting_);
    endTurnIfIdle();
    wakeUp_.notifyOne();
  }
  if (!discarded.empty()) runner_->countDiscarded(discarded.size());
}

bool OwnThreadQueue::hasEnded() const {
  const MutexLock lock(mutex_);
  return hasEnded_;
}

bool OwnThreadQueue::waitForEnd(std::chrono::steady_clock::time_point deadline) {
  const MutexLock lock(mutex_);
  while (!hasEnded_) {
    if (!ended_.waitUntil(mutex_, deadline)) return hasEnded_;
  }
  return true;
}

void OwnThreadQueue::run() {
  setUpThread(label_, priorityFor(quality_));
  const DispatchThread::Working working(this, label_);
  DispatchThread& thread = DispatchThread::current();
  {
    const MutexLock lock(mutex_);
    if (::pthread_getcpuclockid(::pthread_self(), &ownClock_) == 0) ownThread_ = &thread;
  }
  work(thread);
  end();
}

void OwnThreadQueue::work(DispatchThread& thread) {
  const MutexLock lock(mutex_);
  while (waitForWork()) {
    hasWorker_ = true;
    while (takeBatch()) {
      mutex_.unlock();
      while (canGoOn()) runNextInBatch(thread);
      // Wake the pool at the end of each batch. This thread may sleep next, and must not hold back
      // turns while it sleeps.
      thread.wakePool();
      mutex_.lock();
    }
    hasWorker_ = false;
    endTurnIfIdle();
  }
}

// Runs the next job. Consecutive brief jobs wake the pool only once, after the last of them. The
// pool is also woken before a job that may block, because that job may wait for jobs that an
// earlier one has added to shared queues.
void OwnThreadQueue::runNextInBatch(DispatchThread& thread) {
  if (batch_[next_].weight == JobWeight::kBrief) {
    thread.holdPool();
  } else {
    thread.wakePool();
  }
  runNext();
}

// Discards the jobs that remain in the batch after a stop, and reports the end of the thread.
void OwnThreadQueue::end() {
  if (next_ < batch_.size()) runner_->countDiscarded(batch_.size() - next_);
  batch_.clear();
  const MutexLock lock(mutex_);
  ownThread_ = nullptr;  // the thread's object and clock end with the thread
  hasEnded_ = true;
  ended_.notifyAll();
}

// Waits until there are jobs and no other worker. Returns false if the thread should end.
bool OwnThreadQueue::waitForWork() {
  while (hasWorker_ || !hasWork()) {
    // Do not end while a helper works. The helper wakes this thread when it has finished.
    if (!hasWorker_ && life_ != Life::kOpen) return false;
    sleeps_ = true;
    wakeUp_.wait(mutex_);
  }
  sleeps_ = false;
  return true;
}

std::size_t OwnThreadQueue::help(const DispatchThread& helper, std::size_t limit) {
  const DispatchThread::Working working(this, label_);
  std::size_t done = 0;
  bool mustWake = false;
  {
    const MutexLock lock(mutex_);
    // Clear `helper_` first. If this thread adds a job from now on, it must note the queue again or
    // wake the own thread.
    if (helper_ == &helper) helper_ = nullptr;
    if (hasWorker_ || !hasWork()) return 0;
    hasWorker_ = true;
    bool isFront = true;
    while (isFront && takeBatch()) {
      mutex_.unlock();
      while (done < limit && canGoOn() && batch_[next_].weight == JobWeight::kBrief) {
        runNext();
        ++done;
      }
      mutex_.lock();
      // If jobs of this batch are left, do not take newer jobs, because they must run after those.
      isFront = next_ == batch_.size();
    }
    hasWorker_ = false;
    endTurnIfIdle();
    // After close() or stop(), wake the own thread even if there is no work, because it may be
    // waiting for this helper to finish.
    mustWake = (hasWork() || life_ != Life::kOpen) && takeWakeUp();
  }
  if (mustWake) wakeUp_.notifyOne();
  return done;
}

QueueLabels::Jobs OwnThreadQueue::jobs() const {
  const MutexLock lock(mutex_);
  return {.added = added_, .run = ran_.load(std::memory_order_relaxed)};
}

OwnThreadQueue::Progress OwnThreadQueue::progress() const {
  timespec used{};
  static_cast<void>(::clock_gettime(ownClock_, &used));
  return {
      .jobs = ran_.load(std::memory_order_relaxed),
      .processorTime = std::chrono::seconds(used.tv_sec) + std::chrono::nanoseconds(used.tv_nsec)};
}

bool OwnThreadQueue::hasProgressed() {
  const MutexLock lock(mutex_);
  // Without the own thread, the queue has just started or has ended.
  if (ownThread_ == nullptr) return true;
  const Progress now = progress();
  const Progress before = std::exchange(seen_, now);
  const bool isIdle = !hasWorker_ && !hasWork();
  return isIdle || now != before || ownThread_->waits();
}

bool OwnThreadQueue::hasWork() const {
  return life_ != Life::kStopped && (!waiting_.empty() || next_ < batch_.size());
}

// Moves the waiting jobs into the batch, unless the batch still has jobs. Returns false if there is
// no job to run.
bool OwnThreadQueue::takeBatch() {
  if (!hasWork()) return false;
  if (next_ < batch_.size()) return true;
  batch_.clear();
  next_ = 0;
  // Shrink before the swap, because the next jobs are added to this vector.
  if (batch_.capacity() > kKeptCapacity) batch_.shrink_to_fit();
  batch_.swap(waiting_);
  return true;
}

// Returns true if the caller must notify the own thread, because it sleeps and no other thread has
// woken it yet.
bool OwnThreadQueue::takeWakeUp() { return std::exchange(sleeps_, false); }

// Call after each change that may leave the queue without a worker and without a job.
void OwnThreadQueue::endTurnIfIdle() {
  if (hasWorker_ || hasWork()) return;
  if (std::exchange(hasTurn_, false)) runner_->turns().end();
}

bool OwnThreadQueue::canGoOn() const {
  return next_ < batch_.size() && !isStopped_.load(std::memory_order_relaxed);
}

void OwnThreadQueue::runNext() {
  // Move the job out of the batch. The objects that it holds, such as a request's token, are then
  // released when the job has run and not only at the end of the batch.
  const Job job = std::move(batch_[next_++].job);
  runner_->run(job);
  ran_.store(ran_.load(std::memory_order_relaxed) + 1, std::memory_order_relaxed);
}

}  // namespace halvox::platform::linux_
