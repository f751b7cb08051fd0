#pragma once

#include "platform/dispatch.h"
#include "platform/log.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// Carries out jobs for the queues: knows which queue the thread is working for, and takes what jobs
// throw. Shared by all queues of a service and by reference; any thread may run jobs.
class JobRunner {
 public:
  // Both services must outlive the runner.
  JobRunner(LogService& log, StatisticsService& statistics);

  // Marks the calling thread as working for `queue` (null: for none) for a scope; nests.
  class Scope {
   public:
    explicit Scope(const DispatchQueue* queue) : outer_(current_) { current_ = queue; }
    ~Scope() { current_ = outer_; }
    Scope(const Scope&) = delete;
    Scope& operator=(const Scope&) = delete;

   private:
    const DispatchQueue* outer_;
  };
  [[nodiscard]] static bool isCurrent(const DispatchQueue* queue) { return current_ == queue; }

  // Runs one job. What it throws is logged and counted, and goes no further.
  void run(const Job& job) noexcept {
    try {
      job();
    } catch (...) {
      reportFailure();
    }
  }
  void countDiscarded(std::uint64_t jobs) { discarded_.add(jobs); }

 private:
  void reportFailure() noexcept;

  static inline thread_local const DispatchQueue* current_ = nullptr;

  LogCategory& log_;
  Counter& failed_;
  Counter& discarded_;
};

}  // namespace halvox::platform::linux_
