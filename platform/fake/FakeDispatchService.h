#pragma once

#include <chrono>
#include <cstdint>
#include <deque>
#include <functional>
#include <list>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/dispatch.h"
#include "platform/fake/FakeClockService.h"

namespace halvox::platform {

class FakeDispatchService;

// A serial queue. Its jobs wait until the test runs them through the service that made it. Shared
// by its users and its jobs; must not outlive the service.
class FakeDispatchQueue final : public DispatchQueue,
                                public std::enable_shared_from_this<FakeDispatchQueue> {
 public:
  struct Traits {
    std::string label;
    QualityOfService quality;
    QueueThreading threading;
  };

  FakeDispatchQueue(FakeDispatchService& service, Traits traits)
      : service_(service), traits_(std::move(traits)) {}

  [[nodiscard]] const Traits& traits() const { return traits_; }

  void async(JobWeight weight, Job job) override;
  // Throws std::logic_error for what no queue allows: waiting outside of one of its jobs, waiting
  // twice, and waiting on a queue with a thread of its own.
  void waitOn(std::shared_ptr<DispatchSemaphore> semaphore,
              std::optional<std::chrono::nanoseconds> timeout,
              std::function<void(WaitOutcome)> then) override;
  // Returns false unless the test has called FakeDispatchService::letThreadsEnter().
  [[nodiscard]] bool tryEnter() override;
  void leave() override;
  [[nodiscard]] bool isCurrent() const override;

 private:
  friend class FakeDispatchService;

  FakeDispatchService& service_;
  const Traits traits_;
  FakeDispatchQueue* outerQueue_ = nullptr;  // of the thread that has entered
  bool isWaiting_ = false;                   // guarded by the service's mutex
};

// A semaphore of the fake service, which it must not outlive.
class FakeDispatchSemaphore final : public DispatchSemaphore {
 public:
  FakeDispatchSemaphore(FakeDispatchService& service, std::uint64_t signals)
      : service_(service), signals_(signals) {}

  void signal() override;
  // Runs jobs until there is a signal, except those of the queue whose job waits. Throws
  // std::logic_error if no job signals, because a real thread would wait for ever. A job may call
  // it.
  void wait() override;

 private:
  friend class FakeDispatchService;

  FakeDispatchService& service_;
  std::uint64_t signals_;  // guarded by the service's mutex
};

// A dispatch service without threads.
//
// Jobs run on the test's thread, and only when the test runs them: one at a time, in the order in
// which they were added to any queue. Time stands still until the test advances it, and the fake
// clock moves with it. The jobs of a queue that waits on a semaphore do not run until the wait has
// ended, by a signal or by time.
//
// Any thread may add jobs and signal; one thread may run them. FakePlatform owns it. Misuse throws
// std::logic_error.
class FakeDispatchService final : public DispatchService {
 public:
  // Does not own the clock, which must outlive it.
  explicit FakeDispatchService(FakeClockService& clock) : clock_(clock) {}
  ~FakeDispatchService() override;

  // Runs the pending jobs and the jobs that these add. Does not run delayed jobs and jobs of queues
  // that wait on a semaphore.
  void runUntilIdle();
  // Runs the oldest job that may run. Returns false if there is none.
  bool runOne();
  // Lets time pass. First runs all pending jobs. Then runs each delayed job at its time and ends
  // each wait at its time. After each of these steps, runs the jobs that were added. At equal
  // times, delayed jobs run first. While a job runs, the clock shows its time.
  void advance(std::chrono::nanoseconds by);
  // Drops all jobs that have not run, and ends all waits without calling anything. If the
  // destructor of a job adds a job, that job is dropped, too.
  void clear();

  // From now on tryEnter() succeeds for a shared queue that is idle. By default it fails for every
  // queue, as the interface allows, and every job waits until the test runs it.
  void letThreadsEnter() { letsThreadsEnter_ = true; }

  // From now on there is no memory for queues with that label: createSerialQueue() throws
  // std::bad_alloc.
  void failQueues(std::string label);

  [[nodiscard]] std::size_t waitingJobs() const;
  [[nodiscard]] std::size_t delayedJobs() const;
  [[nodiscard]] std::size_t waitingQueues() const;
  // The remaining delay of each delayed job, the next one first.
  [[nodiscard]] std::vector<std::chrono::nanoseconds> delays() const;
  // Installs a handler that runs after each signal, on the signalling thread. It shows a test the
  // state that a waiting thread would find.
  void whenSignalled(std::function<void()> handler);
  // The traits of all queues that were made, in order.
  [[nodiscard]] std::vector<FakeDispatchQueue::Traits> createdQueues() const;
  // The weights of the jobs that were added to queues with that label, in order.
  [[nodiscard]] std::vector<JobWeight> weights(std::string_view label) const;

  std::shared_ptr<DispatchQueue> createSerialQueue(std::string_view label, QualityOfService quality,
                                                   QueueThreading threading) override;
  std::shared_ptr<DispatchSemaphore> createSemaphore(std::uint64_t signals) override;
  void asyncAfterOnBackgroundQueue(std::chrono::nanoseconds delay, Job job) override;

 private:
  friend class FakeDispatchQueue;
  friend class FakeDispatchSemaphore;
  struct Waiting {
    std::shared_ptr<FakeDispatchQueue> queue;
    Job job;
  };
  struct Wait {
    std::shared_ptr<FakeDispatchQueue> queue;
    std::shared_ptr<FakeDispatchSemaphore> semaphore;
    std::optional<std::chrono::nanoseconds> end;
    std::function<void(WaitOutcome)> then;
  };
  using Waits = std::list<Wait>;

  void add(std::shared_ptr<FakeDispatchQueue> queue, JobWeight weight, Job job);
  void beginWait(Wait wait);
  void signal(FakeDispatchSemaphore& semaphore);
  // The caller holds the mutex.
  void addSignal(FakeDispatchSemaphore& semaphore);
  [[nodiscard]] bool tryTakeSignal(FakeDispatchSemaphore& semaphore);
  [[nodiscard]] bool mayEnter(const FakeDispatchQueue& queue) const;
  void setWaiting(FakeDispatchQueue* queue, bool isWaiting);
  // The caller holds the mutex. Lets the queue continue with `then`, before its other jobs.
  void endWait(Wait wait, WaitOutcome outcome);
  [[nodiscard]] Waits::iterator firstToTimeOut();
  bool passNext(std::chrono::nanoseconds until);
  void runDelayed(Job job);
  void moveTimeTo(std::chrono::nanoseconds time);

  FakeClockService& clock_;
  bool letsThreadsEnter_ = false;
  mutable std::mutex mutex_;
  std::deque<Waiting> waiting_;
  Waits waits_;  // in the order in which they began
  std::chrono::nanoseconds now_{0};
  std::multimap<std::chrono::nanoseconds, Job> delayed_;  // by time; equal times keep their order
  std::function<void()> signalHandler_;
  std::vector<FakeDispatchQueue::Traits> created_;
  std::optional<std::string> failingLabel_;
  std::multimap<std::string, JobWeight, std::less<>> weights_;
};

}  // namespace halvox::platform
