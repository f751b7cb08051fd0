#include "platform/linux/dispatch/OwnThreadQueue.h"

#include <stdexcept>

#include "platform/linux/dispatch/BatchedTurns.h"
#include "platform/linux/dispatch/ThreadPriorities.h"

namespace halvox::platform::linux_ {
namespace {

// How many jobs one end of helping may run before it leaves the rest to the queues' own threads.
constexpr std::size_t kHelpedJobsLimit = 1000;
// Room for jobs that a queue keeps when it has nothing to do.
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
  HelpingThread& helper = HelpingThread::current();
  const bool mayHelp = weight == JobWeight::kBrief && helper.isActive();
  bool isNewForHelper = false;
  bool mustWake = false;
  {
    const MutexLock lock(mutex_);
    if (life_ == Life::kStopped) {
      runner_->countDiscarded(1);
      return;  // the job goes with the arguments, when the lock is given back
    }
    waiting_.push_back({std::move(job), weight});
    if (hasWorker_) return;  // the worker looks again before it leaves
    if (mayHelp && helper_ == &helper) return;
    isNewForHelper = mayHelp && helper_ == nullptr;
    if (isNewForHelper) {
      helper_ = &helper;
    } else {
      mustWake = takeWakeUp();
    }
  }
  if (isNewForHelper) helper.note(shared_from_this());
  if (mustWake) wakeUp_.notifyOne();
}

void OwnThreadQueue::waitOn(std::shared_ptr<DispatchSemaphore> /*semaphore*/,
                            std::optional<std::chrono::nanoseconds> /*timeout*/,
                            std::function<void(WaitOutcome)> /*then*/) {
  throw std::logic_error("a queue with a thread of its own was to wait");
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
    discarded.swap(waiting_);
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
  const JobRunner::Scope scope(this, label_);
  work();
  end();
}

void OwnThreadQueue::work() {
  const MutexLock lock(mutex_);
  while (waitForWork()) {
    hasWorker_ = true;
    while (takeBatch()) {
      mutex_.unlock();
      while (canGoOn()) runNextInBatch();
      BatchedTurns::current().end();
      mutex_.lock();
    }
    hasWorker_ = false;
  }
}

void OwnThreadQueue::runNextInBatch() {
  BatchedTurns& turns = BatchedTurns::current();
  if (batch_[next_].weight == JobWeight::kBrief) {
    turns.begin();
  } else {
    turns.end();
  }
  runNext();
}

// Destroys what was discarded in the middle of a batch, and tells that this was the last.
void OwnThreadQueue::end() {
  if (next_ < batch_.size()) runner_->countDiscarded(batch_.size() - next_);
  batch_.clear();
  const MutexLock lock(mutex_);
  hasEnded_ = true;
  ended_.notifyAll();
}

// Waits until there are jobs and nobody works on them; false when the thread should end.
bool OwnThreadQueue::waitForWork() {
  while (hasWorker_ || !hasWork()) {
    if (!hasWorker_ && life_ != Life::kOpen) return false;
    sleeps_ = true;
    wakeUp_.wait(mutex_);
  }
  sleeps_ = false;
  return true;
}

std::size_t OwnThreadQueue::help(HelpingThread& helper, std::size_t limit) {
  const JobRunner::Scope scope(this, label_);
  std::size_t done = 0;
  bool mustWake = false;
  {
    const MutexLock lock(mutex_);
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
      isFront = next_ == batch_.size();
    }
    hasWorker_ = false;
    mustWake = (hasWork() || life_ != Life::kOpen) && takeWakeUp();
  }
  if (mustWake) wakeUp_.notifyOne();
  return done;
}

bool OwnThreadQueue::hasWork() const {
  return life_ != Life::kStopped && (!waiting_.empty() || next_ < batch_.size());
}

// Makes the worker's batch hold the next jobs; false when there are none to run.
bool OwnThreadQueue::takeBatch() {
  if (!hasWork()) return false;
  if (next_ < batch_.size()) return true;
  batch_.clear();
  next_ = 0;
  if (batch_.capacity() > kKeptCapacity) batch_.shrink_to_fit();
  batch_.swap(waiting_);
  return true;
}

// Whether the caller must notify the own thread: it sleeps and nobody else is about to wake it.
bool OwnThreadQueue::takeWakeUp() { return std::exchange(sleeps_, false); }

bool OwnThreadQueue::canGoOn() const {
  return next_ < batch_.size() && !isStopped_.load(std::memory_order_relaxed);
}

void OwnThreadQueue::runNext() {
  // Taken out first, so that what the job holds goes as soon as it has run.
  const Job job = std::move(batch_[next_++].job);
  runner_->run(job);
}

HelpingThread& HelpingThread::current() {
  static thread_local HelpingThread thread;
  return thread;
}

void HelpingThread::end() {
  std::size_t left = kHelpedJobsLimit;
  for (std::size_t index = 0; index < queues_.size(); ++index) {
    const std::shared_ptr<OwnThreadQueue> queue = std::move(queues_[index]);
    left -= queue->help(*this, left);
  }
  queues_.clear();
  isActive_ = false;
}

}  // namespace halvox::platform::linux_
