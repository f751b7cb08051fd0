#pragma once

#include <cstdint>

#include "platform/dispatch.h"
#include "platform/linux/dispatch/OpenTurns.h"
#include "platform/log.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// What all queues of a service share: runs their jobs, catches the exceptions that the jobs throw,
// and counts the queues that have something to run. Shared by the service and its queues, because
// queues can outlive the service. Any thread may use it.
class JobRunner {
 public:
  // `log` and `statistics` must outlive the runner.
  JobRunner(LogService& log, StatisticsService& statistics);

  // Runs one job. If the job throws, logs the exception with the queue's label and counts it. Does
  // not pass it on, because one bad job must not stop the queue.
  void run(const Job& job) noexcept {
    try {
      job();
    } catch (...) {
      reportFailure();
    }
  }
  [[nodiscard]] OpenTurns& turns() { return turns_; }
  void countDiscarded(std::uint64_t jobs) { discarded_.add(jobs); }

 private:
  // Call it in a catch block.
  void reportFailure() noexcept;

  LogCategory& log_;
  Counter& failed_;
  Counter& discarded_;
  OpenTurns turns_;
};

}  // namespace halvox::platform::linux_
