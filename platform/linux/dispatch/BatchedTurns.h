#pragma once

#include <memory>
#include <utility>
#include <vector>

namespace halvox::platform::linux_ {

class SharedQueue;

// The turns of shared queues that a thread begins together at the end of its batch of brief jobs,
// so that many jobs wake the pool once. Belongs to one thread.
//
// Nothing in a batch may wait for what it handed over: a job that can wait for anything is no part
// of it.
class BatchedTurns {
 public:
  // The calling thread's own.
  static BatchedTurns& current();

  BatchedTurns() = default;
  BatchedTurns(const BatchedTurns&) = delete;
  BatchedTurns& operator=(const BatchedTurns&) = delete;
  ~BatchedTurns() { end(); }

  [[nodiscard]] bool isActive() const { return isActive_; }
  void begin() { isActive_ = true; }
  // Begins the turns that were noted, in the order in which they were.
  void end();
  void note(std::shared_ptr<SharedQueue> queue) { queues_.push_back(std::move(queue)); }

 private:
  bool isActive_ = false;
  std::vector<std::shared_ptr<SharedQueue>> queues_;
};

}  // namespace halvox::platform::linux_
