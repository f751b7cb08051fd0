#include "platform/linux/diagnostics/WaitableFlag.h"

#include <algorithm>
#include <cstdint>

#include <sys/eventfd.h>
#include <unistd.h>

namespace halvox::platform::linux_ {

WaitableFlag::WaitableFlag() : event_(::eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {}

void WaitableFlag::raise() {
  // Raise the flag before the descriptor becomes readable, because a thread that wakes up must find
  // the flag raised.
  raised_.store(true, std::memory_order_release);
  const std::uint64_t one = 1;
  static_cast<void>(!::write(event_.get(), &one, sizeof one));
}

CaptureDeadline CaptureDeadline::within(Clock::duration time) const {
  return {stop_, std::min(end_, Clock::now() + time)};
}

int CaptureDeadline::millisecondsLeft() const {
  if (hasPassed()) return 0;
  const auto left = std::chrono::ceil<std::chrono::milliseconds>(end_ - Clock::now());
  return static_cast<int>(std::max<std::chrono::milliseconds::rep>(left.count(), 0));
}

}  // namespace halvox::platform::linux_
