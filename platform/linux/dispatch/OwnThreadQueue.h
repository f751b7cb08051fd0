#pragma once

#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <string>
#include <thread>
#include <utility>
#include <vector>

#include "platform/dispatch.h"
#include "platform/linux/base/Mutex.h"
#include "platform/linux/dispatch/JobRunner.h"

namespace halvox::platform::linux_ {

class HelpingThread;

// A serial queue with a thread of its own, whose brief jobs another thread may carry out too.
//
// Whoever runs jobs, the own thread or a helper, first becomes the queue's worker; there is at most
// one. The worker takes all waiting jobs in one batch and runs them in order. A worker that leaves
// jobs behind wakes the own thread, so jobs never lie about:
//
//   no worker --take--> worker --nothing left--> no worker
//                          \--left to the own thread (limit, job that may block)--> no worker,
//                          woken
//
// Any thread may add jobs. Adding never fails and has no bound: whoever adds bounds what it adds.
// Ends with close() (its jobs are still run) or stop() (they are discarded).
class OwnThreadQueue final : public DispatchQueue,
                             public std::enable_shared_from_this<OwnThreadQueue> {
 public:
  // Starts the thread; throws std::system_error when the system has none to give.
  static std::shared_ptr<OwnThreadQueue> start(std::string label, QualityOfService quality,
                                               std::shared_ptr<JobRunner> runner);
  // Must not run on the queue's own thread; waits for its end.
  ~OwnThreadQueue() override;

  void async(JobWeight weight, Job job) override;
  // Throws std::logic_error, which fails the job: only shared queues wait.
  void waitOn(std::shared_ptr<DispatchSemaphore> semaphore,
              std::optional<std::chrono::nanoseconds> timeout,
              std::function<void(WaitOutcome)> then) override;
  [[nodiscard]] const std::string& label() const { return label_; }
  [[nodiscard]] bool isCurrent() const override { return JobRunner::isCurrent(this); }

  // Lets the thread end once all jobs have run. Nobody adds jobs any more.
  void close();
  // Lets the thread end after the job that is running; discards those that wait and those to come.
  void stop();
  // True once the thread will touch nothing any more: joining it takes no time.
  [[nodiscard]] bool hasEnded() const;
  // Waits for the end of the thread until that time; false when it has not ended by then.
  bool waitForEnd(std::chrono::steady_clock::time_point deadline);

  // Runs the brief jobs from the front on the calling thread, at most `limit` of them, unless there
  // is a worker already. What is left is left to the own thread. Returns how many were run.
  std::size_t help(HelpingThread& helper, std::size_t limit);

 private:
  enum class Life : std::uint8_t { kOpen, kClosed, kStopped };
  struct Item {
    Job job;
    JobWeight weight = JobWeight::kBrief;
  };

  OwnThreadQueue(std::string label, QualityOfService quality, std::shared_ptr<JobRunner> runner);
  void run();
  void work();
  void end();
  [[nodiscard]] bool waitForWork() HALVOX_REQUIRES(mutex_);
  [[nodiscard]] bool hasWork() const HALVOX_REQUIRES(mutex_);
  [[nodiscard]] bool takeBatch() HALVOX_REQUIRES(mutex_);
  [[nodiscard]] bool takeWakeUp() HALVOX_REQUIRES(mutex_);
  [[nodiscard]] bool canGoOn() const;
  void runNext();
  void runNextInBatch();

  const std::string label_;
  const QualityOfService quality_;
  const std::shared_ptr<JobRunner> runner_;  // shared with the service and its other queues

  mutable Mutex mutex_;
  Condition wakeUp_;
  Condition ended_;
  std::vector<Item> waiting_ HALVOX_GUARDED_BY(mutex_);
  bool hasWorker_ HALVOX_GUARDED_BY(mutex_) = false;
  bool sleeps_ HALVOX_GUARDED_BY(mutex_) = false;  // the own thread waits, and nobody woke it yet
  Life life_ HALVOX_GUARDED_BY(mutex_) = Life::kOpen;
  bool hasEnded_ HALVOX_GUARDED_BY(mutex_) = false;
  // The thread that will help with the jobs it added; nobody else needs to be woken for them.
  const HelpingThread* helper_ HALVOX_GUARDED_BY(mutex_) = nullptr;
  // Orders with nothing: life_ decides, this only ends a batch early.
  std::atomic<bool> isStopped_{false};

  // Belong to the worker. Becoming it under the mutex orders this use after the last worker's.
  std::vector<Item> batch_;
  std::size_t next_ = 0;

  std::thread thread_;  // last: it uses all of the above
};

// One thread's helping: the queues that it will help when its batch of requests is delivered.
// Belongs to that thread.
class HelpingThread {
 public:
  HelpingThread() = default;
  HelpingThread(const HelpingThread&) = delete;
  HelpingThread& operator=(const HelpingThread&) = delete;
  ~HelpingThread() { end(); }

  // The calling thread's own.
  static HelpingThread& current();

  [[nodiscard]] bool isActive() const { return isActive_; }
  void begin() { isActive_ = true; }
  // Helps each queue that was noted, in the order in which they were, those included that helped
  // jobs add to.
  void end();
  void note(std::shared_ptr<OwnThreadQueue> queue) { queues_.push_back(std::move(queue)); }

 private:
  bool isActive_ = false;
  std::vector<std::shared_ptr<OwnThreadQueue>> queues_;
};

}  // namespace halvox::platform::linux_
