#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "platform/dispatch.h"
#include "platform/linux/base/Mutex.h"
#include "platform/log.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

class DispatchPool;
class JobRunner;
class OwnThreadQueue;

// Queues over threads of their own and over a small pool (Asio). Nothing runs while nothing is to
// be done. A job that throws is logged and counted; its queue goes on. A shared queue that waits on
// a semaphore costs memory only.
//
// Quality of service: threads for utility and background work run at a lower scheduling priority,
// each for good, so the pool has threads of its own for each quality, made when first needed. What
// requests wait for must not be of a lower quality than theirs. Labels name own threads, and count
// the jobs of shared queues: a queue that is stuck has more jobs added than run, and is named in
// the log when it keeps the service from ending.
//
// Helping: a thread that hands a batch of requests to a queue puts them between beginHelping() and
// endHelping(). Brief jobs that it adds to a queue with an own thread then wake nobody; at the end
// it carries them out itself, as long as no job that may block is in front of them and the queue's
// own thread is not at work. A small batch so costs no change of threads. The order of jobs is kept
// and never two of a queue run at once, whoever runs them.
//
// Holding the pool: what a thread adds to shared queues between holdPool() and wakePool() runs from
// the latter on, so that many jobs wake the pool once, when the thread has time for it. A thread of
// an own queue holds it by itself while it runs brief jobs.
class AsioDispatchService final : public DispatchService {
 public:
  // Both services must outlive this one and its queues. Throws std::system_error when the system
  // has no threads to give.
  AsioDispatchService(LogService& log, StatisticsService& statistics);
  // Stops, and waits for the jobs that run without a limit.
  ~AsioDispatchService() override;

  std::shared_ptr<DispatchQueue> createSerialQueue(std::string_view label, QualityOfService quality,
                                                   QueueThreading threading) override;
  std::shared_ptr<DispatchSemaphore> createSemaphore(std::uint64_t signals) override;
  void asyncAfterOnBackgroundQueue(std::chrono::nanoseconds delay, Job job) override;

  // From the same thread, in turns. Whoever begins or holds must reach the end soon: the jobs wait
  // for it.
  void beginHelping();
  void endHelping();
  void holdPool();
  void wakePool();

  // Lets the shared queues run what they have, for `limit` at most; for an end that loses nothing.
  // Queues that wait and jobs whose time has not come are not waited for. Not from a job.
  void finish(std::chrono::milliseconds limit);
  // Ends all threads: the jobs that run end, those that wait, those of waiting queues and those to
  // come are discarded and counted. Waits for `limit` at most; false when a job still runs then,
  // and the process should end without destroying this. May be called again; not from a job.
  bool stop(std::chrono::milliseconds limit);

 private:
  std::shared_ptr<DispatchQueue> createOwnThreadQueue(std::string_view label,
                                                      QualityOfService quality);
  void logStuck(const std::vector<std::string>& labels);

  LogCategory& log_;
  const std::shared_ptr<JobRunner> runner_;
  const std::shared_ptr<DispatchPool> pool_;
  Mutex mutex_;
  bool isStopped_ HALVOX_GUARDED_BY(mutex_) = false;
  // All whose thread may still run; ended ones are removed when a new one is made.
  std::vector<std::shared_ptr<OwnThreadQueue>> ownThreadQueues_ HALVOX_GUARDED_BY(mutex_);
};

}  // namespace halvox::platform::linux_
