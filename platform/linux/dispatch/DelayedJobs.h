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

namespace halvox::platform::linux_ {

class DispatchPool;

// Jobs that wait for their time: any number of them with one timer of the kernel and no thread. The
// timer is always set for the earliest job and for nothing else: where a wait ends before its
// time-out, nothing wakes up when that would have come. (asio's own timers leave that wake-up.)
// Any thread may add jobs; they run on the pool's threads of their quality, in no order with
// others. Belongs to the pool, whose utility threads look after the timer: jobs of a lower quality
// that take their time cannot delay it. No thread may run when it is destroyed.
class DelayedJobs {
 public:
  // By its time, then by the order of coming.
  using Time = std::chrono::steady_clock::time_point;
  using Ticket = std::pair<Time, std::uint64_t>;

  // Throws std::system_error when the system has no descriptor to give.
  explicit DelayedJobs(DispatchPool& pool);

  // Runs the job after that delay; a negative one is none, one of more than ten years is ten years.
  Ticket add(std::chrono::nanoseconds delay, QualityOfService quality, Job job);
  // Lets a job go whose time has not come; one that is on its way, or gone, is left alone.
  void cancel(const Ticket& ticket);
  // Discards the jobs that wait and those to come.
  void stop();

 private:
  struct Delayed {
    QualityOfService quality;
    Job job;
  };

  // Sets the timer for the earliest job, or stops it when there is none.
  void arm() HALVOX_REQUIRES(mutex_);
  void awaitTimer() HALVOX_REQUIRES(mutex_);
  void onTimer();
  void runDue(const Job& job);

  DispatchPool& pool_;
  Mutex mutex_;
  bool isStopped_ HALVOX_GUARDED_BY(mutex_) = false;
  std::map<Ticket, Delayed> jobs_ HALVOX_GUARDED_BY(mutex_);
  std::uint64_t added_ HALVOX_GUARDED_BY(mutex_) = 0;
  std::optional<Time> armedFor_ HALVOX_GUARDED_BY(mutex_);
  asio::posix::stream_descriptor timer_ HALVOX_GUARDED_BY(mutex_);
};

}  // namespace halvox::platform::linux_
