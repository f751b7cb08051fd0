#pragma once

#include <chrono>
#include <cstdint>
#include <deque>
#include <map>
#include <memory>
#include <mutex>
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
  [[nodiscard]] bool isCurrent() const override;

 private:
  FakeDispatchService& service_;
  const Traits traits_;
};

// A dispatch service without threads. Jobs run on the thread of the test and only when it pumps:
// one at a time, in the order in which they were added over all queues. Time stands still until the
// test advances it, and takes the fake clock with it. Any thread may add jobs; one may pump.
class FakeDispatchService final : public DispatchService {
 public:
  // Does not own the clock, which must outlive it.
  explicit FakeDispatchService(FakeClockService& clock) : clock_(clock) {}
  ~FakeDispatchService() override;

  // Runs the jobs that are waiting and those that they add, until none is left; delayed ones stay.
  void runUntilIdle();
  // Runs the job that has waited longest; false when there is none.
  bool runOne();
  // Lets time pass: runs all waiting jobs, then each delayed job at its time, with all that follows
  // from it, in the order of their times. The clock shows that time while it runs.
  void advance(std::chrono::nanoseconds by);
  // Drops all jobs that have not run. Their destructors may add jobs, which are dropped too.
  void clear();

  [[nodiscard]] std::size_t waitingJobs() const;
  [[nodiscard]] std::size_t delayedJobs() const;
  // How long each delayed job still waits, the next one first.
  [[nodiscard]] std::vector<std::chrono::nanoseconds> delays() const;
  // The traits of every queue that was made, in order.
  [[nodiscard]] std::vector<FakeDispatchQueue::Traits> createdQueues() const;
  // The weights of the jobs added to queues of that label, in order.
  [[nodiscard]] std::vector<JobWeight> weights(std::string_view label) const;

  std::shared_ptr<DispatchQueue> createSerialQueue(std::string_view label, QualityOfService quality,
                                                   QueueThreading threading) override;
  void asyncAfterOnBackgroundQueue(std::chrono::nanoseconds delay, Job job) override;

 private:
  friend class FakeDispatchQueue;
  struct Waiting {
    std::shared_ptr<const FakeDispatchQueue> queue;  // null: the background queue
    Job job;
  };
  void add(std::shared_ptr<const FakeDispatchQueue> queue, JobWeight weight, Job job);
  bool runNextDelayed(std::chrono::nanoseconds until);
  void moveTimeTo(std::chrono::nanoseconds time);

  FakeClockService& clock_;
  mutable std::mutex mutex_;
  std::deque<Waiting> waiting_;
  std::chrono::nanoseconds now_{0};
  std::multimap<std::chrono::nanoseconds, Job> delayed_;  // by time; equal times keep their order
  std::vector<FakeDispatchQueue::Traits> created_;
  std::multimap<std::string, JobWeight, std::less<>> weights_;
};

}  // namespace halvox::platform
