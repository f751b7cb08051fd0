#pragma once

#include <cstddef>
#include <cstdint>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {

// The owner of a descriptor that an EventLoop watches.
class EventSource {
 public:
  virtual ~EventSource() = default;
  // `events` are those of epoll(7).
  virtual void onReady(std::uint32_t events) = 0;
};

// Waits for descriptors to become ready (epoll, level-triggered). A source that does not read
// everything is called again in the next turn, after the other sources. One busy client can
// therefore not starve the others. Idle descriptors cost nothing. Belongs to one thread. Does not
// own the sources. A source must exist until the end of the turn in which it was removed, because
// the loop may already have fetched an event for it.
class EventLoop {
 public:
  enum class Wait : std::uint8_t { kBlock, kPoll };

  EventLoop();
  EventLoop(const EventLoop&) = delete;
  EventLoop& operator=(const EventLoop&) = delete;

  // Returns false if the system has no descriptor left.
  [[nodiscard]] bool isOpen() const { return static_cast<bool>(epoll_); }

  // `events` are those of epoll(7). Returns false if the system refuses to watch another
  // descriptor.
  [[nodiscard]] bool watch(int fd, std::uint32_t events, EventSource& source);
  void change(int fd, std::uint32_t events, EventSource& source);
  void forget(int fd);

  // Waits, then calls the sources that are ready, at most kEventsPerTurn of them. Returns their
  // number.
  std::size_t runOnce(Wait wait);

 private:
  UniqueFd epoll_;
};

}  // namespace halvox::platform::linux_
