#pragma once

#include <atomic>
#include <memory>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/dispatch.h"

namespace halvox::platform::linux_ {

class OwnThreadQueue;
class SharedQueue;

// What the queues know about one thread: which queue it works for, which queues it will help, and
// which turns of shared queues it holds back until its batch ends.
//
//   helping: off --beginHelping()--> on --endHelping(): runs the noted queues' brief jobs--> off
//   holding: off --holdPool()--> on --wakePool(): begins the noted turns--> off
//
// This is the only thread-local object of the adapter. It must be thread-local because the inner
// ring, which calls DispatchQueue::async(), has no batch that it could pass. Belongs to its thread;
// other threads may only ask whether it waits. When the thread ends, the destructor ends helping
// and holding.
class DispatchThread {
 public:
  // Returns the calling thread's object.
  static DispatchThread& current();

  DispatchThread() = default;
  DispatchThread(const DispatchThread&) = delete;
  DispatchThread& operator=(const DispatchThread&) = delete;
  ~DispatchThread();

  // While this object exists, the calling thread is marked as working for `queue` (null: for no
  // queue). May be nested.
  class Working {
   public:
    // `label` names the queue in the log. The caller owns the text.
    Working(const DispatchQueue* queue, std::string_view label)
        : thread_(current()),
          outerQueue_(std::exchange(thread_.queue_, queue)),
          outerLabel_(std::exchange(thread_.label_, label)) {}
    Working(const Working&) = delete;
    Working& operator=(const Working&) = delete;
    ~Working() {
      thread_.queue_ = outerQueue_;
      thread_.label_ = outerLabel_;
    }

   private:
    DispatchThread& thread_;
    const DispatchQueue* outerQueue_;
    std::string_view outerLabel_;  // owned by the outer queue
  };
  // While this object exists, the calling thread is marked as waiting for other threads.
  class Waiting {
   public:
    Waiting() : thread_(current()) { thread_.waits_.store(true, std::memory_order_relaxed); }
    Waiting(const Waiting&) = delete;
    Waiting& operator=(const Waiting&) = delete;
    ~Waiting() { thread_.waits_.store(false, std::memory_order_relaxed); }

   private:
    DispatchThread& thread_;
  };
  // Any thread may call this function.
  [[nodiscard]] bool waits() const { return waits_.load(std::memory_order_relaxed); }
  [[nodiscard]] bool worksFor(const DispatchQueue* queue) const { return queue_ == queue; }
  [[nodiscard]] std::string_view label() const { return label_; }

  [[nodiscard]] bool isHelping() const { return isHelping_; }
  void beginHelping() { isHelping_ = true; }
  // Helps the noted queues in the order in which they were noted, including those that are noted
  // during this call.
  void endHelping();
  void noteQueueToHelp(std::shared_ptr<OwnThreadQueue> queue) {
    queuesToHelp_.push_back(std::move(queue));
  }

  [[nodiscard]] bool isHoldingPool() const { return isHoldingPool_; }
  // A thread that holds the pool must not wait for jobs that it has added to shared queues, because
  // they start only at wakePool().
  void holdPool() { isHoldingPool_ = true; }
  // Begins the noted turns in the order in which they were noted.
  void wakePool();
  void noteTurn(std::shared_ptr<SharedQueue> queue) { turns_.push_back(std::move(queue)); }

 private:
  const DispatchQueue* queue_ = nullptr;
  std::string_view label_;  // owned by the maker of the innermost Working
  // Relaxed, because a reader draws no conclusion about other data from it.
  std::atomic<bool> waits_{false};
  bool isHelping_ = false;
  bool isHoldingPool_ = false;
  // Both lists keep their capacity between batches.
  std::vector<std::shared_ptr<OwnThreadQueue>> queuesToHelp_;
  std::vector<std::shared_ptr<SharedQueue>> turns_;
};

}  // namespace halvox::platform::linux_
