#pragma once

#include <memory>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/dispatch.h"

namespace halvox::platform::linux_ {

class OwnThreadQueue;
class SharedQueue;

// One thread, as the queues see it: which queue it works for, which queues it will help, and which
// turns it holds back until its batch ends.
//
//   helping: off --beginHelping()--> on --endHelping(): runs the brief jobs it added--> off
//   holding: off --holdPool()--> on --wakePool(): begins the noted turns--> off
//
// This is the only thread-local of the adapter. It has to be one: the inner ring, which calls
// DispatchQueue::async(), has no batch that it could pass. Belongs to its thread; no other thread
// may touch it. When the thread ends, it ends helping and holding if they are still on.
class DispatchThread {
 public:
  // Returns the calling thread's object.
  static DispatchThread& current();

  DispatchThread() = default;
  DispatchThread(const DispatchThread&) = delete;
  DispatchThread& operator=(const DispatchThread&) = delete;
  ~DispatchThread();

  // Marks the calling thread as working for `queue` (null: for none) while this object exists. May
  // be nested.
  class Working {
   public:
    // The caller owns `label`, which names the queue in the log.
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
  [[nodiscard]] bool worksFor(const DispatchQueue* queue) const { return queue_ == queue; }
  [[nodiscard]] std::string_view label() const { return label_; }

  [[nodiscard]] bool isHelping() const { return isHelping_; }
  void beginHelping() { isHelping_ = true; }
  // Helps each noted queue, in the order of the notes. Includes the queues that helped jobs note.
  void endHelping();
  void noteQueueToHelp(std::shared_ptr<OwnThreadQueue> queue) {
    queuesToHelp_.push_back(std::move(queue));
  }

  [[nodiscard]] bool isHoldingPool() const { return isHoldingPool_; }
  // A thread that holds the pool must not wait for its own jobs in the pool: the pool has not been
  // woken for them.
  void holdPool() { isHoldingPool_ = true; }
  // Begins the noted turns, in the order of the notes.
  void wakePool();
  void noteTurn(std::shared_ptr<SharedQueue> queue) { turns_.push_back(std::move(queue)); }

 private:
  const DispatchQueue* queue_ = nullptr;
  std::string_view label_;  // owned by the maker of the innermost Working
  bool isHelping_ = false;
  bool isHoldingPool_ = false;
  // Both keep their capacity between batches.
  std::vector<std::shared_ptr<OwnThreadQueue>> queuesToHelp_;
  std::vector<std::shared_ptr<SharedQueue>> turns_;
};

}  // namespace halvox::platform::linux_
