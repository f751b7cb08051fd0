#pragma once

#include <chrono>
#include <cstdint>
#include <optional>

#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/connection/EventLoop.h"

namespace halvox::platform::linux_ {

class DeadlineQueue;

// Who wants to hear when something took too long.
class DeadlineOwner {
 public:
  virtual ~DeadlineOwner() = default;
  virtual void onDeadline() = 0;
};

// One deadline of an owner, in at most one queue; leaves it when destroyed. Belongs to one thread.
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

// Deadlines that all have the same delay, so that the first one to start is the first one due and
// starting or stopping one costs the same however many there are. Belongs to one thread.
class DeadlineQueue {
 public:
  using Clock = std::chrono::steady_clock;

  explicit DeadlineQueue(std::chrono::milliseconds delay) : delay_(delay) {}
  DeadlineQueue(const DeadlineQueue&) = delete;
  DeadlineQueue& operator=(const DeadlineQueue&) = delete;

  // Starts a deadline; one that is running goes on as it was.
  void start(Deadline& deadline);
  // When the first one is due.
  [[nodiscard]] std::optional<Clock::time_point> first() const;
  // Stops each that is due and calls its owner.
  void expire(Clock::time_point now);
  [[nodiscard]] std::chrono::milliseconds delay() const { return delay_; }

 private:
  friend class Deadline;
  void remove(Deadline& deadline);

  std::chrono::milliseconds delay_;
  Deadline* first_ = nullptr;
  Deadline* last_ = nullptr;
};

// The timer of a loop, set only while something can become due. Belongs to the loop's thread.
class LoopTimer final : public EventSource {
 public:
  enum class Before : std::uint8_t { kSleep, kNextTurn };

  // False when the system gave no timer.
  [[nodiscard]] bool open(EventLoop& loop);
  // Sees to it that the loop wakes up at `due`. A timer that is set too early is left alone, since
  // it is set anew when it goes off; one that nobody needs is switched off before the loop sleeps.
  void arrange(std::optional<std::chrono::steady_clock::time_point> due, Before before);
  void onReady(std::uint32_t events) override;

 private:
  void set(std::optional<std::chrono::steady_clock::time_point> due);

  UniqueFd fd_;
  std::optional<std::chrono::steady_clock::time_point> setTo_;
};

}  // namespace halvox::platform::linux_
