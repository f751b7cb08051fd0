#pragma once

#include <chrono>
#include <map>

#define ASIO_STANDALONE
#include <asio/io_context.hpp>
#include <asio/steady_timer.hpp>

#include "platform/dispatch.h"
#include "platform/linux/Mutex.h"
#include "platform/linux/runtime/JobRunner.h"

namespace halvox::platform::linux_ {

// Jobs that wait for their time: any number of them with one timer and no thread.
// Any thread may add jobs; they run on the threads of the context, in no order with others.
// `context` and `runner` must outlive it, and no thread run the context when it is destroyed.
class DelayedJobs {
 public:
  DelayedJobs(asio::io_context& context, JobRunner& runner);

  // Runs the job after that delay; a negative one is none, one of more than ten years is ten years.
  void add(std::chrono::nanoseconds delay, Job job);
  // Discards the jobs that wait and those to come.
  void stop();

 private:
  using Time = std::chrono::steady_clock::time_point;

  void arm() HALVOX_REQUIRES(mutex_);
  void onTimer();
  void runDue(const Job& job);

  asio::io_context& context_;
  JobRunner& runner_;
  Mutex mutex_;
  bool isStopped_ HALVOX_GUARDED_BY(mutex_) = false;
  std::multimap<Time, Job> jobs_ HALVOX_GUARDED_BY(mutex_);
  asio::steady_timer timer_ HALVOX_GUARDED_BY(mutex_);
};

}  // namespace halvox::platform::linux_
