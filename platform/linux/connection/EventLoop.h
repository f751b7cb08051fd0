#pragma once

#include <cstddef>
#include <cstdint>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {

// Something with a descriptor that an EventLoop watches.
class EventSource {
 public:
  virtual ~EventSource() = default;
  // `events` are those of epoll(7).
  virtual void onReady(std::uint32_t events) = 0;
};

// Waits for descriptors to become ready, level-triggered: a source that does not take all there is
// hears of it again in the next turn, after the others. Idle descriptors cost nothing per turn.
// Belongs to one thread. Does not own sources; each must stay until the end of the turn in which it
// was forgotten.
class EventLoop {
 public:
  enum class Wait : std::uint8_t { kBlock, kPoll };

  EventLoop();
  EventLoop(const EventLoop&) = delete;
  EventLoop& operator=(const EventLoop&) = delete;

  // False when the system gave no descriptor for it.
  [[nodiscard]] bool isOpen() const { return static_cast<bool>(epoll_); }

  // False when the system has no room for one more.
  [[nodiscard]] bool watch(int fd, std::uint32_t events, EventSource& source);
  void change(int fd, std::uint32_t events, EventSource& source);
  void forget(int fd);

  // Waits, and calls each source that is ready, at most kEventsPerTurn of them. Returns how many.
  std::size_t runOnce(Wait wait);

 private:
  UniqueFd epoll_;
};

}  // namespace halvox::platform::linux_
