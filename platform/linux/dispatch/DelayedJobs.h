#pragma once

#include <chrono>
#include <cstdint>
#include <map>
#include <optional>
#include <utility>

#include <asio/posix/stream_descriptor.hpp>

#include "platform/dispatch.h"
#include "platform/linux/base/Mutex.h"
#include "platform/linux/dispatch/JobRunner.h"
#include "platform/linux/dispatch/QueueLabels.h"

namespace halvox::platform::linux_ {

class DispatchPool;

// Runs jobs after a delay. Any number of jobs needs one kernel timer and no thread.
//
// The timer is always set for the earliest job, and disabled if there is none. A wait that ends
// before its time-out therefore causes no wake-up later. With Asio's own timers it did. The pool's
// utility threads watch the timer. Background threads cannot, because their jobs may take long and
// would delay it.
//
// Owned by the pool. Any thread may add jobs. Due jobs run on the pool's threads of their quality,
// in no particular order relative to other jobs. Each has a turn (OpenTurns) from the moment when
// it is due until it has ended. The number of jobs has no bound here, because
// waiting messages are charged to the clients that sent them. No thread of the pool may run when
// this object is destroyed.
class DelayedJobs {
 public:
  // A ticket identifies a job. Tickets are sorted by the time when the job is due, then by the
  // order in which the jobs were added.
  using Time = std::chrono::steady_clock::time_point;
  using Ticket = std::pair<Time, std::uint64_t>;

  // Throws std::system_error if the system has no descriptor left.
  explicit DelayedJobs(DispatchPool& pool);

  // Runs the job after the delay. A negative delay counts as 0, a delay of more than ten years as
  // ten years.
  Ticket add(std::chrono::nanoseconds delay, QualityOfService quality, Job job);
  // Destroys a job that is not due yet. Does nothing to a job that is about to run or has run.
  void cancel(const Ticket& ticket);
  // Starts the jobs that are due now, without waiting for the timer.
  void startDue();
  // The jobs that have become due, and those of them that have ended.
  [[nodiscard]] QueueLabels::Jobs dueJobs();
  // Discards and counts all jobs, including those that are added later.
  void stop();

 private:
  struct Delayed {
    QualityOfService quality;
    Job job;
  };

  // Sets the timer for the earliest job, or disables it when there is none.
  void arm() HALVOX_REQUIRES(mutex_);
  void awaitTimer() HALVOX_REQUIRES(mutex_);
  void onTimer();
  void postDue() HALVOX_REQUIRES(mutex_);
  void runDue(Job job);

  DispatchPool& pool_;
  Mutex mutex_;
  bool isStopped_ HALVOX_GUARDED_BY(mutex_) = false;
  std::map<Ticket, Delayed> jobs_ HALVOX_GUARDED_BY(mutex_);
  std::uint64_t added_ HALVOX_GUARDED_BY(mutex_) = 0;
  QueueLabels::Jobs due_ HALVOX_GUARDED_BY(mutex_);
  std::optional<Time> armedFor_ HALVOX_GUARDED_BY(mutex_);
  asio::posix::stream_descriptor timer_ HALVOX_GUARDED_BY(mutex_);
};

}  // namespace halvox::platform::linux_
