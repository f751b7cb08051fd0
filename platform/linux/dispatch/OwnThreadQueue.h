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
#include <vector>

#include <sys/types.h>

#include "platform/dispatch.h"
#include "platform/linux/base/Mutex.h"
#include "platform/linux/dispatch/DispatchThread.h"
#include "platform/linux/dispatch/JobRunner.h"
#include "platform/linux/dispatch/QueueLabels.h"

namespace halvox::platform::linux_ {

// A serial queue with a thread of its own. Another thread may run its brief jobs, too.
//
// Another thread may help because a request that crosses to the own thread and back costs two
// wake-ups, as many as a bare echo of the request needs in all (docs/decisions/0002). A thread that
// runs jobs, the own thread or a helper, first becomes the queue's worker. There is at most one
// worker at a time, which makes the queue serial. The worker takes all waiting jobs in one batch,
// because a batch needs the lock only once. A worker that leaves jobs in the queue wakes the own
// thread. No job is therefore forgotten:
//
//   no worker --takes a batch--> worker --no job is left--> no worker
//                                   \--the limit, or a job that may block, is reached-->
//                                                   no worker, the own thread is woken
//
// Any thread may add jobs. The number of jobs has no bound here, because the connections stop
// reading from clients that have too many open requests.
//
//   open --close()--> closed: runs its jobs --> ended
//     \----stop()---> stopped: discards and counts them --> ended
class OwnThreadQueue final : public DispatchQueue,
                             public std::enable_shared_from_this<OwnThreadQueue> {
 public:
  // Starts the thread. Throws std::system_error if the system has no thread left.
  static std::shared_ptr<OwnThreadQueue> start(std::string label, QualityOfService quality,
                                               std::shared_ptr<JobRunner> runner);
  // Stops, and waits for the thread. Must not run on that thread.
  ~OwnThreadQueue() override;

  void async(JobWeight weight, Job job) override;
  // Throws std::logic_error, which makes the calling job fail. Only shared queues can wait.
  void waitOn(std::shared_ptr<DispatchSemaphore> semaphore,
              std::optional<std::chrono::nanoseconds> timeout,
              std::function<void(WaitOutcome)> then) override;
  [[nodiscard]] const std::string& label() const { return label_; }
  [[nodiscard]] bool isCurrent() const override { return DispatchThread::current().worksFor(this); }

  // Lets the thread end after all jobs have run. No jobs may be added from now on.
  void close();
  // Lets the thread end after the job that is running. Discards the waiting jobs and those that are
  // added later.
  void stop();
  // Returns true if the thread has finished its last work. Joining it then takes no time.
  [[nodiscard]] bool hasEnded() const;
  // Waits for the end of the thread, at most until `deadline`. Returns false if the thread has not
  // ended by then.
  bool waitForEnd(std::chrono::steady_clock::time_point deadline);

  // Runs the brief jobs at the front of the queue on the calling thread, at most `limit` of them.
  // Does nothing while there is another worker. Wakes the own thread for the jobs that remain.
  // Returns how many jobs it ran. `helper` is the calling thread.
  std::size_t help(const DispatchThread& helper, std::size_t limit);

  // The numbers of jobs that were added and that have run. After stop() the discarded jobs count
  // only as added.
  [[nodiscard]] QueueLabels::Jobs jobs() const HALVOX_EXCLUDES(mutex_);
  // Returns false if the queue has been stuck since the last call: it has a job, no job has ended,
  // its thread has used no processor time, and the job does not wait on a semaphore.
  [[nodiscard]] bool hasProgressed() HALVOX_EXCLUDES(mutex_);

 private:
  enum class Life : std::uint8_t { kOpen, kClosed, kStopped };
  struct Item {
    Job job;
    JobWeight weight = JobWeight::kBrief;
  };
  // What changes while the queue makes progress.
  struct Progress {
    std::uint64_t jobs = 0;
    std::chrono::nanoseconds processorTime{0};  // of the own thread
    bool operator==(const Progress&) const = default;
  };

  OwnThreadQueue(std::string label, QualityOfService quality, std::shared_ptr<JobRunner> runner);
  void run();
  void work(DispatchThread& thread);
  void end();
  [[nodiscard]] bool waitForWork() HALVOX_REQUIRES(mutex_);
  [[nodiscard]] bool hasWork() const HALVOX_REQUIRES(mutex_);
  [[nodiscard]] bool takeBatch() HALVOX_REQUIRES(mutex_);
  [[nodiscard]] bool takeWakeUp() HALVOX_REQUIRES(mutex_);
  void endTurnIfIdle() HALVOX_REQUIRES(mutex_);
  [[nodiscard]] Progress progress() const HALVOX_REQUIRES(mutex_);
  [[nodiscard]] bool canGoOn() const;
  void runNext();
  void runNextInBatch(DispatchThread& thread);

  const std::string label_;
  const QualityOfService quality_;
  const std::shared_ptr<JobRunner> runner_;  // shared with the service and its other queues

  mutable Mutex mutex_;
  Condition wakeUp_;
  Condition ended_;
  std::vector<Item> waiting_ HALVOX_GUARDED_BY(mutex_);
  bool hasWorker_ HALVOX_GUARDED_BY(mutex_) = false;
  // True while the own thread waits and has not been woken. The thread that wakes it clears this
  // first, and further jobs then cost no wake-up.
  bool sleeps_ HALVOX_GUARDED_BY(mutex_) = false;
  Life life_ HALVOX_GUARDED_BY(mutex_) = Life::kOpen;
  // Whether this queue counts among the open turns: it has a job that runs or can run.
  bool hasTurn_ HALVOX_GUARDED_BY(mutex_) = false;
  std::uint64_t added_ HALVOX_GUARDED_BY(mutex_) = 0;
  bool hasEnded_ HALVOX_GUARDED_BY(mutex_) = false;
  // The thread that will help this queue, or null. Brief jobs that it adds do not wake the own
  // thread.
  const DispatchThread* helper_ HALVOX_GUARDED_BY(mutex_) = nullptr;
  // The own thread while it runs, otherwise null, and its clock of processor time.
  const DispatchThread* ownThread_ HALVOX_GUARDED_BY(mutex_) = nullptr;
  clockid_t ownClock_ HALVOX_GUARDED_BY(mutex_) = 0;
  Progress seen_ HALVOX_GUARDED_BY(mutex_);  // at the last hasProgressed()
  // Lets the worker end a batch early without taking the lock for each job. Relaxed, because
  // `life_` decides.
  std::atomic<bool> isStopped_{false};

  // Written by the worker only. Relaxed, because it only shows the progress.
  std::atomic<std::uint64_t> ran_{0};

  // The batch belongs to the worker. A thread becomes the worker under the mutex, and the mutex
  // orders its use of the batch after that of the previous worker.
  std::vector<Item> batch_;
  std::size_t next_ = 0;

  std::thread thread_;  // last, because it uses all members above
};

}  // namespace halvox::platform::linux_
