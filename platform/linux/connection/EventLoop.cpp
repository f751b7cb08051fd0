#include "platform/linux/connection/EventLoop.h"

#include <array>

#include <sys/epoll.h>

#include "platform/linux/connection/ConnectionLimits.h"

namespace halvox::platform::linux_ {
namespace {

epoll_event eventFor(std::uint32_t events, EventSource& source) {
  epoll_event event{};
  event.events = events;
  event.data.ptr = &source;
  return event;
}

}  // namespace

EventLoop::EventLoop() : epoll_(epoll_create1(EPOLL_CLOEXEC)) {}

bool EventLoop::watch(int fd, std::uint32_t events, EventSource& source) {
  epoll_event event = eventFor(events, source);
  return epoll_ctl(epoll_.get(), EPOLL_CTL_ADD, fd, &event) == 0;
}

void EventLoop::change(int fd, std::uint32_t events, EventSource& source) {
  epoll_event event = eventFor(events, source);
  static_cast<void>(epoll_ctl(epoll_.get(), EPOLL_CTL_MOD, fd, &event));
}

void EventLoop::forget(int fd) {
  static_cast<void>(epoll_ctl(epoll_.get(), EPOLL_CTL_DEL, fd, nullptr));
}

std::size_t EventLoop::runOnce(Wait wait) {
  std::array<epoll_event, kEventsPerTurn> events;
  const int timeout = wait == Wait::kBlock ? -1 : 0;
  const int count = epoll_wait(epoll_.get(), events.data(), kEventsPerTurn, timeout);
  for (int index = 0; index < count; ++index) {
    const epoll_event& event = events[static_cast<std::size_t>(index)];
    static_cast<EventSource*>(event.data.ptr)->onReady(event.events);
  }
  return count > 0 ? static_cast<std::size_t>(count) : 0;
}

}  // namespace halvox::platform::linux_
