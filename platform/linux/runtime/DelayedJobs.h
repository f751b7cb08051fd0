#pragma once

#include <chrono>
#include <cstdint>
#include <map>
#include <optional>
#include <utility>

#include <asio/io_context.hpp>
#include <asio/steady_timer.hpp>

#include "platform/dispatch.h"
#include "platform/linux/Mutex.h"
#include "platform/linux/runtime/JobRunner.h"

namespace halvox::platform::linux_ {

// Jobs that wait for their time: any number of them with one timer and no thread. Cancelling leaves
// the timer as it is, so it may go off once for a job that is there no more; that costs less than
// setting it anew each time.
// Any thread may add jobs; they run on the threads of the context, in no order with others.
// `context` and `runner` must outlive it, and no thread run the context when it is destroyed.
class DelayedJobs {
 public:
  // By its time, then by the order of coming.
  using Time = std::chrono::steady_clock::time_point;
  using Ticket = std::pair<Time, std::uint64_t>;

  DelayedJobs(asio::io_context& context, JobRunner& runner);

  // Runs the job after that delay; a negative one is none, one of more than ten years is ten years.
  Ticket add(std::chrono::nanoseconds delay, Job job);
  // Lets a job go whose time has not come; one that is on its way, or gone, is left alone.
  void cancel(const Ticket& ticket);
  // Discards the jobs that wait and those to come.
  void stop();

 private:
  void arm() HALVOX_REQUIRES(mutex_);
  void onTimer();
  void runDue(const Job& job);

  asio::io_context& context_;
  JobRunner& runner_;
  Mutex mutex_;
  bool isStopped_ HALVOX_GUARDED_BY(mutex_) = false;
  std::map<Ticket, Job> jobs_ HALVOX_GUARDED_BY(mutex_);
  std::uint64_t added_ HALVOX_GUARDED_BY(mutex_) = 0;
  std::optional<Time> armedFor_ HALVOX_GUARDED_BY(mutex_);
  asio::steady_timer timer_ HALVOX_GUARDED_BY(mutex_);
};

}  // namespace halvox::platform::linux_
