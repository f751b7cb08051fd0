#pragma once

#include <chrono>
#include <cstdint>
#include <optional>

#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/connection/EventLoop.h"

namespace halvox::platform::linux_ {

class DeadlineQueue;

// The owner of a Deadline. It is called when the deadline has passed.
class DeadlineOwner {
 public:
  virtual ~DeadlineOwner() = default;
  virtual void onDeadline() = 0;
};

// One deadline of an owner. A running deadline is in exactly one queue; the destructor removes it
// from there. Belongs to the thread of the queue.
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

// The running deadlines that have the same delay. The deadline that started first is due first, and
// a linked list is enough to keep that order. Starting or stopping a deadline takes constant time,
// because every request of every client may do both. Does not own the deadlines. Belongs to one
// thread.
class DeadlineQueue {
 public:
  using Clock = std::chrono::steady_clock;

  explicit DeadlineQueue(std::chrono::milliseconds delay) : delay_(delay) {}
  DeadlineQueue(const DeadlineQueue&) = delete;
  DeadlineQueue& operator=(const DeadlineQueue&) = delete;

  // Starts a deadline. Does nothing if it is running.
  void start(Deadline& deadline);
  // Returns the time when the first deadline is due; std::nullopt if none is running.
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

// The timer of a loop. The timer is set only while a deadline is running, because an idle service
// must not wake up. Belongs to the loop's thread.
class LoopTimer final : public EventSource {
 public:
  enum class Before : std::uint8_t { kSleep, kNextTurn };

  // Returns false if the system cannot make a timer or watch it.
  [[nodiscard]] bool open(EventLoop& loop);
  // Makes the loop wake up at `due`. If the timer is set to an earlier time, leaves it as it is: it
  // expires early and is then set again. This saves a system call for most requests. If `due` is
  // empty, disables the timer, but only before the loop sleeps.
  void arrange(std::optional<std::chrono::steady_clock::time_point> due, Before before);
  void onReady(std::uint32_t events) override;

 private:
  void set(std::optional<std::chrono::steady_clock::time_point> due);

  UniqueFd fd_;
  std::optional<std::chrono::steady_clock::time_point> setTo_;
};

}  // namespace halvox::platform::linux_
