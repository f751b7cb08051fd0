#pragma once

#include <chrono>
#include <cstdint>
#include <optional>

#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/connection/EventLoop.h"

namespace halvox::platform::linux_ {

class DeadlineQueue;

// The owner of a Deadline, which is called when the deadline has passed.
class DeadlineOwner {
 public:
  virtual ~DeadlineOwner() = default;
  virtual void onDeadline() = 0;
};

// One deadline of an owner. Is in at most one queue. The destructor removes the deadline from its
// queue. Belongs to the thread of the queue.
class Deadline {
 public:
  explicit Deadline(DeadlineOwner& owner) : owner_(owner) {}
  Deadline(const Deadline&) = delete;
  Deadline& operator=(const Deadline&) = delete;
  ~Deadline() { stop(); }

  [[nodiscard]] bool isRunning() const { return queue_ != nullptr; }
  void stop();

 private:
  friend class DeadlineQueue;
  DeadlineOwner& owner_;
  DeadlineQueue* queue_ = nullptr;
  Deadline* previous_ = nullptr;
  Deadline* next_ = nullptr;
  std::chrono::steady_clock::time_point at_;
};

// Deadlines with the same delay. The deadline that started first is therefore due first, and a
// linked list keeps the order. Starting or stopping a deadline takes constant time, because every
// request of every client may do both. Does not own the deadlines. Belongs to one thread.
class DeadlineQueue {
 public:
  using Clock = std::chrono::steady_clock;

  explicit DeadlineQueue(std::chrono::milliseconds delay) : delay_(delay) {}
  DeadlineQueue(const DeadlineQueue&) = delete;
  DeadlineQueue& operator=(const DeadlineQueue&) = delete;

  // Starts a deadline. Does nothing if it is running.
  void start(Deadline& deadline);
  // When the first deadline is due; none without deadlines.
  [[nodiscard]] std::optional<Clock::time_point> first() const;
  // Stops each due deadline and calls its owner, which may start and stop deadlines.
  void expire(Clock::time_point now);
  [[nodiscard]] std::chrono::milliseconds delay() const { return delay_; }

 private:
  friend class Deadline;
  void remove(Deadline& deadline);

  std::chrono::milliseconds delay_;
  Deadline* first_ = nullptr;
  Deadline* last_ = nullptr;
};

// The timer of a loop. It is set only while something can become due, because an idle service must
// not wake up. Belongs to the loop's thread.
class LoopTimer final : public EventSource {
 public:
  enum class Before : std::uint8_t { kSleep, kNextTurn };

  // Returns false if the system gave no timer.
  [[nodiscard]] bool open(EventLoop& loop);
  // Makes the loop wake up at `due`. A timer that is set too early stays as it is until it expires
  // and is set again. This saves a system call for most requests. A timer that is not needed any
  // more is disabled before the loop sleeps.
  void arrange(std::optional<std::chrono::steady_clock::time_point> due, Before before);
  void onReady(std::uint32_t events) override;

 private:
  void set(std::optional<std::chrono::steady_clock::time_point> due);

  UniqueFd fd_;
  std::optional<std::chrono::steady_clock::time_point> setTo_;
};

}  // namespace halvox::platform::linux_
