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

// A serial queue whose jobs wait until the test pumps the service that made it.
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
  // Refuses by std::logic_error what no queue does: waiting outside a job of its own, waiting
  // twice, and waiting on a queue with a thread of its own.
  void waitOn(std::shared_ptr<DispatchSemaphore> semaphore,
              std::optional<std::chrono::nanoseconds> timeout,
              std::function<void(WaitOutcome)> then) override;
  [[nodiscard]] bool isCurrent() const override;

 private:
  friend class FakeDispatchService;

  FakeDispatchService& service_;
  const Traits traits_;
  bool isWaiting_ = false;  // guarded by the service's mutex
};

// Signals of the fake service. Must not outlive it.
class FakeDispatchSemaphore final : public DispatchSemaphore {
 public:
  FakeDispatchSemaphore(FakeDispatchService& service, std::uint64_t signals)
      : service_(service), signals_(signals) {}

  void signal() override;
  // Runs the jobs that may run, but those of the queue whose job waits, until there is a signal;
  // std::logic_error when none of them signals. May be called by a job.
  void wait() override;

 private:
  friend class FakeDispatchService;

  FakeDispatchService& service_;
  std::uint64_t signals_;  // guarded by the service's mutex
};

// A dispatch service without threads. Jobs run on the thread of the test and only when it pumps:
// one at a time, in the order in which they were added over all queues. Time stands still until the
// test advances it, and takes the fake clock with it. The jobs of a queue that waits stay until its
// wait has ended, by a signal or by time. Any thread may add jobs and signal; one may pump.
class FakeDispatchService final : public DispatchService {
 public:
  // Does not own the clock, which must outlive it.
  explicit FakeDispatchService(FakeClockService& clock) : clock_(clock) {}
  ~FakeDispatchService() override;

  // Runs the jobs that are waiting and those that they add, until none is left but those of queues
  // that wait; delayed ones stay.
  void runUntilIdle();
  // Runs the job that has waited longest and may run; false when there is none.
  bool runOne();
  // Lets time pass: runs all waiting jobs, then each delayed job and the end of each wait at its
  // time, with all that follows from it, in the order of their times (at one time the delayed jobs
  // first). The clock shows that time while it runs.
  void advance(std::chrono::nanoseconds by);
  // Drops all jobs that have not run, and ends all waits without a word. Their destructors may add
  // jobs, which are dropped too.
  void clear();

  [[nodiscard]] std::size_t waitingJobs() const;
  [[nodiscard]] std::size_t delayedJobs() const;
  [[nodiscard]] std::size_t waitingQueues() const;
  // How long each delayed job still waits, the next one first.
  [[nodiscard]] std::vector<std::chrono::nanoseconds> delays() const;
  // Called by whoever signals a semaphore, after each signal: what a thread that waits would find.
  void whenSignalled(std::function<void()> handler);
  // The traits of every queue that was made, in order.
  [[nodiscard]] std::vector<FakeDispatchQueue::Traits> createdQueues() const;
  // The weights of the jobs added to queues of that label, in order.
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
  // Under the mutex.
  void addSignal(FakeDispatchSemaphore& semaphore);
  [[nodiscard]] bool tryTakeSignal(FakeDispatchSemaphore& semaphore);
  void setWaiting(FakeDispatchQueue* queue, bool isWaiting);
  // Under the mutex: lets the queue go on with `then`, in front of its other jobs.
  void endWait(Wait wait, WaitOutcome outcome);
  [[nodiscard]] Waits::iterator firstToTimeOut();
  bool passNext(std::chrono::nanoseconds until);
  void runDelayed(Job job);
  void moveTimeTo(std::chrono::nanoseconds time);

  FakeClockService& clock_;
  mutable std::mutex mutex_;
  std::deque<Waiting> waiting_;
  Waits waits_;  // in the order in which they began
  std::chrono::nanoseconds now_{0};
  std::multimap<std::chrono::nanoseconds, Job> delayed_;  // by time; equal times keep their order
  std::function<void()> signalHandler_;
  std::vector<FakeDispatchQueue::Traits> created_;
  std::multimap<std::string, JobWeight, std::less<>> weights_;
};

}  // namespace halvox::platform
