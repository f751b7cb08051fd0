#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "platform/dispatch.h"
#include "platform/linux/base/Mutex.h"
#include "platform/linux/dispatch/QueueLabels.h"
#include "platform/log.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

class DispatchPool;
class JobRunner;
class OwnThreadQueue;

// Queues on threads of their own and on a small pool (Asio). All threads sleep while there is
// nothing to do. A job that throws is logged and counted, and its queue continues. A shared queue
// that waits on a semaphore costs memory, not a thread.
//
//   running --stop(): ends after the running jobs, discards the waiting ones--> stopped
//
// Owned by the platform, which stops it before the services that jobs use are destroyed. Any thread
// may call its functions, unless a comment says otherwise.
//
// Quality of service: utility and background work runs at a lower scheduling priority. A thread
// cannot raise its priority again without a privilege. The pool therefore has threads for each
// quality, which it starts when they are first needed. A job for which requests wait must not have
// a lower quality than the requests. The label of a queue is the name of its own thread, or the
// name under which the jobs of shared queues are counted. A stuck queue has more jobs added than
// run; if it keeps the service from ending, the log names its label.
//
// Helping: the I/O thread delivers a batch of requests between beginHelping() and endHelping().
// Brief jobs that it adds in that time to a queue with a thread of its own do not wake that thread.
// In endHelping() the I/O thread runs these jobs itself, unless the queue's own thread is working
// or a job that may block is in front of them. A brief request then costs no switch of threads. The
// queue stays serial and keeps the order of its jobs. docs/decisions/0002 has the reasons.
//
// Holding the pool: jobs that a thread adds to shared queues between holdPool() and wakePool()
// start at wakePool(). Many jobs then wake the pool only once, after the answers to the requests
// are written. When each message woke the pool, the service took 1.61 times the processor time of a
// bare echo; now it takes 1.07 times (docs/measurements.md). The thread of a queue with its own
// thread holds the pool, too, while it runs brief jobs.
class AsioDispatchService final : public DispatchService {
 public:
  // `log` and `statistics` must outlive this service and its queues. Throws std::system_error if
  // the system has no threads or descriptors left.
  AsioDispatchService(LogService& log, StatisticsService& statistics);
  // Stops, and waits without a time limit for the running jobs to end.
  ~AsioDispatchService() override;

  std::shared_ptr<DispatchQueue> createSerialQueue(std::string_view label, QualityOfService quality,
                                                   QueueThreading threading) override;
  std::shared_ptr<DispatchSemaphore> createSemaphore(std::uint64_t signals) override;
  void asyncAfterOnBackgroundQueue(std::chrono::nanoseconds delay, Job job) override;

  // These functions apply to the calling thread. After beginHelping() call endHelping(), and after
  // holdPool() wakePool(), on the same thread and soon, because the jobs wait for that call.
  void beginHelping();
  void endHelping();
  void holdPool();
  void wakePool();

  // How long finish() waits at most: while no job ends, and in total.
  struct FinishLimits {
    std::chrono::milliseconds withoutProgress;
    std::chrono::milliseconds total;
  };
  // Waits until all queues have run their jobs, and the jobs that these add. An orderly end calls
  // this to lose nothing. Does not wait for queues that wait on semaphores, nor for delayed jobs
  // that are not due. Returns 0, or the number of jobs that had not run at the limit. Must not be
  // called from a job.
  [[nodiscard]] std::uint64_t finish(const FinishLimits& limits);
  // For a watchdog: returns false if a queue with a thread of its own and that label has been stuck
  // since the last call. Such a queue has a job, but no job has ended and its thread has used no
  // processor time. A job that computes for minutes is therefore never taken for stuck, nor is a
  // job that waits on a semaphore: others work for it, and the stop of a traced session waits for
  // its trace without a time limit.
  [[nodiscard]] bool hasProgressed(std::string_view label);
  // Ends each thread after the job that it runs. Discards and counts all other jobs, and those that
  // are added later. Waits at most for `limit`. If a job still runs then, logs the labels of the
  // stuck queues and returns false; the process should then end without destroying this object. May
  // be called again. Must not be called from a job.
  bool stop(std::chrono::milliseconds limit);

 private:
  std::shared_ptr<DispatchQueue> createOwnThreadQueue(std::string_view label,
                                                      QualityOfService quality);
  // The jobs of all queues together.
  [[nodiscard]] QueueLabels::Jobs jobs() HALVOX_EXCLUDES(mutex_);
  void logStuck(const std::vector<std::string>& labels);

  LogCategory& log_;
  const std::shared_ptr<JobRunner> runner_;
  const std::shared_ptr<DispatchPool> pool_;
  Mutex mutex_;
  bool isStopped_ HALVOX_GUARDED_BY(mutex_) = false;
  // The queues whose threads may still run. Those whose threads have ended are removed when a new
  // queue is made.
  std::vector<std::shared_ptr<OwnThreadQueue>> ownThreadQueues_ HALVOX_GUARDED_BY(mutex_);
};

}  // namespace halvox::platform::linux_
