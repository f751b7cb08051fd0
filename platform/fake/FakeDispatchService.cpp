#include "platform/fake/FakeDispatchService.h"

#include <stdexcept>
#include <utility>

namespace halvox::platform {
namespace {

// What this thread is running: whether a job at all, and of which queue (null: of the background
// queue).
thread_local bool runningJob = false;
thread_local const DispatchQueue* runningQueue = nullptr;

class RunningMark {
 public:
  explicit RunningMark(const DispatchQueue* queue) {
    // Pumping inside a job would run a queue's jobs inside each other, which no real queue does.
    if (runningJob) throw std::logic_error("a job of the fake dispatch service pumped it");
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

}  // namespace

void FakeDispatchQueue::async(JobWeight weight, Job job) {
  service_.add(shared_from_this(), weight, std::move(job));
}

bool FakeDispatchQueue::isCurrent() const { return runningQueue == this; }

FakeDispatchService::~FakeDispatchService() { clear(); }

void FakeDispatchService::runUntilIdle() {
  while (runOne()) {
  }
}

bool FakeDispatchService::runOne() {
  Waiting next;
  {
    const std::lock_guard lock(mutex_);
    if (waiting_.empty()) return false;
    next = std::move(waiting_.front());
    waiting_.pop_front();
  }
  const RunningMark mark(next.queue.get());
  next.job();
  next.job = nullptr;  // what the job held goes while it still counts as running
  return true;
}

void FakeDispatchService::advance(std::chrono::nanoseconds by) {
  runUntilIdle();
  const std::chrono::nanoseconds until = now_ + by;
  while (runNextDelayed(until)) runUntilIdle();
  moveTimeTo(until);
}

bool FakeDispatchService::runNextDelayed(std::chrono::nanoseconds until) {
  std::chrono::nanoseconds time{};
  Job job;
  {
    const std::lock_guard lock(mutex_);
    const auto next = delayed_.begin();
    if (next == delayed_.end() || next->first > until) return false;
    time = next->first;
    job = std::move(next->second);
    delayed_.erase(next);
  }
  moveTimeTo(time);
  const RunningMark mark(nullptr);
  job();
  job = nullptr;
  return true;
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
    std::multimap<std::chrono::nanoseconds, Job> delayed;
    const std::lock_guard lock(mutex_);
    if (waiting_.empty() && delayed_.empty()) return;
    waiting.swap(waiting_);
    delayed.swap(delayed_);
  }
}

std::size_t FakeDispatchService::waitingJobs() const {
  const std::lock_guard lock(mutex_);
  return waiting_.size();
}

std::size_t FakeDispatchService::delayedJobs() const {
  const std::lock_guard lock(mutex_);
  return delayed_.size();
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

std::shared_ptr<DispatchQueue> FakeDispatchService::createSerialQueue(std::string_view label,
                                                                      QualityOfService quality,
                                                                      QueueThreading threading) {
  const std::lock_guard lock(mutex_);
  created_.push_back({std::string(label), quality, threading});
  return std::make_shared<FakeDispatchQueue>(*this, created_.back());
}

void FakeDispatchService::asyncAfterOnBackgroundQueue(std::chrono::nanoseconds delay, Job job) {
  const std::lock_guard lock(mutex_);
  delayed_.emplace(now_ + delay, std::move(job));
}

void FakeDispatchService::add(std::shared_ptr<const FakeDispatchQueue> queue, JobWeight weight,
                              Job job) {
  const std::lock_guard lock(mutex_);
  weights_.emplace(queue->traits().label, weight);
  waiting_.push_back({std::move(queue), std::move(job)});
}

}  // namespace halvox::platform
