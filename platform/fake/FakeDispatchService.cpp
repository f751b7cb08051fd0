#include "platform/fake/FakeDispatchService.h"

#include <algorithm>
#include <new>
#include <stdexcept>
#include <utility>

namespace halvox::platform {
namespace {

// Whether this thread runs a job, and the queue of that job; null for the background queue.
thread_local bool runningJob = false;
thread_local FakeDispatchQueue* runningQueue = nullptr;

class RunningMark {
 public:
  explicit RunningMark(FakeDispatchQueue* queue) {
    // Running jobs inside a job would nest jobs of one queue, which no real queue does.
    if (runningJob) throw std::logic_error("a job called a function that runs jobs");
    runningJob = true;
    runningQueue = queue;
  }
  RunningMark(const RunningMark&) = delete;
  RunningMark& operator=(const RunningMark&) = delete;
  ~RunningMark() {
    runningJob = false;
    runningQueue = nullptr;
  }
};

// While a job waits, its thread counts as running no job and may run other jobs.
class StandingMark {
 public:
  StandingMark() : wasRunning_(std::exchange(runningJob, false)), queue_(runningQueue) {
    runningQueue = nullptr;
  }
  StandingMark(const StandingMark&) = delete;
  StandingMark& operator=(const StandingMark&) = delete;
  ~StandingMark() {
    runningJob = wasRunning_;
    runningQueue = queue_;
  }
  [[nodiscard]] FakeDispatchQueue* queue() const { return queue_; }

 private:
  const bool wasRunning_;
  FakeDispatchQueue* const queue_;
};

}  // namespace

void FakeDispatchQueue::async(JobWeight weight, Job job) {
  service_.add(shared_from_this(), weight, std::move(job));
}

bool FakeDispatchQueue::tryEnter() {
  if (!service_.mayEnter(*this)) return false;
  outerQueue_ = std::exchange(runningQueue, this);
  return true;
}

void FakeDispatchQueue::leave() { runningQueue = outerQueue_; }

bool FakeDispatchQueue::isCurrent() const { return runningQueue == this; }

void FakeDispatchQueue::waitOn(std::shared_ptr<DispatchSemaphore> semaphore,
                               std::optional<std::chrono::nanoseconds> timeout,
                               std::function<void(WaitOutcome)> then) {
  if (!isCurrent()) throw std::logic_error("waitOn() was called outside its queue's jobs");
  if (traits_.threading != QueueThreading::kShared) {
    throw std::logic_error("waitOn() was called on a queue with a thread of its own");
  }
  auto own = std::dynamic_pointer_cast<FakeDispatchSemaphore>(std::move(semaphore));
  if (own == nullptr) throw std::logic_error("waitOn() needs a semaphore of this service");
  service_.beginWait({shared_from_this(), std::move(own), timeout, std::move(then)});
}

void FakeDispatchSemaphore::signal() { service_.signal(*this); }

void FakeDispatchSemaphore::wait() {
  const StandingMark standing;
  service_.setWaiting(standing.queue(), true);
  while (!service_.tryTakeSignal(*this)) {
    if (!service_.runOne()) throw std::logic_error("no job remains that could signal");
  }
  service_.setWaiting(standing.queue(), false);
}

FakeDispatchService::~FakeDispatchService() { clear(); }

void FakeDispatchService::runUntilIdle() {
  while (runOne()) {
  }
}

bool FakeDispatchService::runOne() {
  Waiting next;
  {
    const std::lock_guard lock(mutex_);
    const auto first = std::ranges::find_if(
        waiting_, [](const Waiting& waiting) { return !waiting.queue->isWaiting_; });
    if (first == waiting_.end()) return false;
    next = std::move(*first);
    waiting_.erase(first);
  }
  const RunningMark mark(next.queue.get());
  next.job();
  next.job = nullptr;  // releases what the job holds while the job still counts as running
  return true;
}

void FakeDispatchService::advance(std::chrono::nanoseconds by) {
  runUntilIdle();
  const std::chrono::nanoseconds until = now_ + by;
  while (passNext(until)) runUntilIdle();
  moveTimeTo(until);
}

// Moves time to the next delayed job or the next end of a wait, whichever is first, and carries
// that out. Returns false if there is none up to `until`.
bool FakeDispatchService::passNext(std::chrono::nanoseconds until) {
  std::chrono::nanoseconds time{};
  Job job;
  std::optional<Wait> wait;
  {
    const std::lock_guard lock(mutex_);
    const auto delayed = delayed_.begin();
    const auto timingOut = firstToTimeOut();
    const bool isWait = timingOut != waits_.end() &&
                        (delayed == delayed_.end() || *timingOut->end < delayed->first);
    if (!isWait && delayed == delayed_.end()) return false;
    time = isWait ? *timingOut->end : delayed->first;
    if (time > until) return false;
    if (isWait) {
      wait = std::move(*timingOut);
      waits_.erase(timingOut);
    } else {
      job = std::move(delayed->second);
      delayed_.erase(delayed);
    }
  }
  moveTimeTo(time);
  if (!wait.has_value()) {
    runDelayed(std::move(job));
    return true;
  }
  const std::lock_guard lock(mutex_);
  endWait(std::move(*wait), WaitOutcome::kTimedOut);
  return true;
}

FakeDispatchService::Waits::iterator FakeDispatchService::firstToTimeOut() {
  auto first = waits_.end();
  for (auto wait = waits_.begin(); wait != waits_.end(); ++wait) {
    if (!wait->end.has_value()) continue;
    if (first == waits_.end() || *wait->end < *first->end) first = wait;
  }
  return first;
}

void FakeDispatchService::runDelayed(Job job) {
  const RunningMark mark(nullptr);
  job();
  job = nullptr;  // releases what the job holds while the job still counts as running
}

void FakeDispatchService::moveTimeTo(std::chrono::nanoseconds time) {
  std::chrono::nanoseconds by{};
  {
    const std::lock_guard lock(mutex_);
    by = time - std::exchange(now_, time);
  }
  clock_.advance(by);
}

void FakeDispatchService::clear() {
  while (true) {
    std::deque<Waiting> waiting;
    Waits waits;
    std::multimap<std::chrono::nanoseconds, Job> delayed;
    const std::lock_guard lock(mutex_);
    if (waiting_.empty() && waits_.empty() && delayed_.empty()) return;
    for (const Wait& wait : waits_) wait.queue->isWaiting_ = false;
    waits.swap(waits_);
    waiting.swap(waiting_);
    delayed.swap(delayed_);
  }
}

bool FakeDispatchService::mayEnter(const FakeDispatchQueue& queue) const {
  const std::lock_guard lock(mutex_);
  const bool isShared = queue.traits().threading == QueueThreading::kShared;
  if (!letsThreadsEnter_ || !isShared || queue.isWaiting_ || queue.isCurrent()) return false;
  return std::ranges::none_of(
      waiting_, [&queue](const Waiting& waiting) { return waiting.queue.get() == &queue; });
}

std::size_t FakeDispatchService::waitingJobs() const {
  const std::lock_guard lock(mutex_);
  return waiting_.size();
}

std::size_t FakeDispatchService::delayedJobs() const {
  const std::lock_guard lock(mutex_);
  return delayed_.size();
}

std::size_t FakeDispatchService::waitingQueues() const {
  const std::lock_guard lock(mutex_);
  return waits_.size();
}

std::vector<std::chrono::nanoseconds> FakeDispatchService::delays() const {
  const std::lock_guard lock(mutex_);
  std::vector<std::chrono::nanoseconds> result;
  for (const auto& [time, job] : delayed_) result.push_back(time - now_);
  return result;
}

std::vector<FakeDispatchQueue::Traits> FakeDispatchService::createdQueues() const {
  const std::lock_guard lock(mutex_);
  return created_;
}

std::vector<JobWeight> FakeDispatchService::weights(std::string_view label) const {
  const std::lock_guard lock(mutex_);
  std::vector<JobWeight> result;
  const auto [first, last] = weights_.equal_range(label);
  for (auto weight = first; weight != last; ++weight) result.push_back(weight->second);
  return result;
}

void FakeDispatchService::failQueues(std::string label) {
  const std::lock_guard lock(mutex_);
  failingLabel_ = std::move(label);
}

std::shared_ptr<DispatchQueue> FakeDispatchService::createSerialQueue(std::string_view label,
                                                                      QualityOfService quality,
                                                                      QueueThreading threading) {
  const std::lock_guard lock(mutex_);
  if (label == failingLabel_) throw std::bad_alloc();
  created_.push_back({std::string(label), quality, threading});
  return std::make_shared<FakeDispatchQueue>(*this, created_.back());
}

std::shared_ptr<DispatchSemaphore> FakeDispatchService::createSemaphore(std::uint64_t signals) {
  return std::make_shared<FakeDispatchSemaphore>(*this, signals);
}

void FakeDispatchService::asyncAfterOnBackgroundQueue(std::chrono::nanoseconds delay, Job job) {
  const std::lock_guard lock(mutex_);
  delayed_.emplace(now_ + delay, std::move(job));
}

void FakeDispatchService::add(std::shared_ptr<FakeDispatchQueue> queue, JobWeight weight, Job job) {
  const std::lock_guard lock(mutex_);
  weights_.emplace(queue->traits().label, weight);
  waiting_.push_back({std::move(queue), std::move(job)});
}

void FakeDispatchService::beginWait(Wait wait) {
  const std::lock_guard lock(mutex_);
  if (wait.queue->isWaiting_) throw std::logic_error("a job called waitOn() twice");
  wait.queue->isWaiting_ = true;
  if (wait.semaphore->signals_ > 0) {
    --wait.semaphore->signals_;
    return endWait(std::move(wait), WaitOutcome::kSignalled);
  }
  if (wait.end.has_value()) {
    if (wait.end->count() <= 0) return endWait(std::move(wait), WaitOutcome::kTimedOut);
    *wait.end = now_ + std::min(*wait.end, std::chrono::nanoseconds::max() - now_);
  }
  waits_.push_back(std::move(wait));
}

bool FakeDispatchService::tryTakeSignal(FakeDispatchSemaphore& semaphore) {
  const std::lock_guard lock(mutex_);
  if (semaphore.signals_ == 0) return false;
  --semaphore.signals_;
  return true;
}

void FakeDispatchService::setWaiting(FakeDispatchQueue* queue, bool isWaiting) {
  if (queue == nullptr) return;
  const std::lock_guard lock(mutex_);
  queue->isWaiting_ = isWaiting;
}

void FakeDispatchService::whenSignalled(std::function<void()> handler) {
  const std::lock_guard lock(mutex_);
  signalHandler_ = std::move(handler);
}

void FakeDispatchService::signal(FakeDispatchSemaphore& semaphore) {
  std::function<void()> handler;
  {
    const std::lock_guard lock(mutex_);
    addSignal(semaphore);
    handler = signalHandler_;
  }
  if (handler) handler();
}

void FakeDispatchService::addSignal(FakeDispatchSemaphore& semaphore) {
  const auto first = std::ranges::find_if(
      waits_, [&](const Wait& wait) { return wait.semaphore.get() == &semaphore; });
  if (first == waits_.end()) {
    ++semaphore.signals_;
    return;
  }
  Wait wait = std::move(*first);
  waits_.erase(first);
  endWait(std::move(wait), WaitOutcome::kSignalled);
}

void FakeDispatchService::endWait(Wait wait, WaitOutcome outcome) {
  wait.queue->isWaiting_ = false;
  const auto place = std::ranges::find_if(
      waiting_, [&](const Waiting& waiting) { return waiting.queue == wait.queue; });
  Job job = [then = std::move(wait.then), outcome] { then(outcome); };
  waiting_.insert(place, {std::move(wait.queue), std::move(job)});
}

}  // namespace halvox::platform
