#pragma once

#include <string_view>

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

  // Marks the calling thread as working for `queue` (null: for none) for a scope; nests. The label,
  // which the caller keeps, is for the log.
  class Scope {
   public:
    Scope(const DispatchQueue* queue, std::string_view label)
        : outer_(current_), outerLabel_(currentLabel_) {
      current_ = queue;
      currentLabel_ = label;
    }
    ~Scope() {
      current_ = outer_;
      currentLabel_ = outerLabel_;
    }
    Scope(const Scope&) = delete;
    Scope& operator=(const Scope&) = delete;

   private:
    const DispatchQueue* outer_;
    std::string_view outerLabel_;  // owned as the queue's label is
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
  static inline thread_local std::string_view currentLabel_;  // owned by whoever has the scope

  LogCategory& log_;
  Counter& failed_;
  Counter& discarded_;
};

}  // namespace halvox::platform::linux_
