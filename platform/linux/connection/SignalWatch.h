#pragma once

#include <cstdint>
#include <functional>

#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/connection/EventLoop.h"

namespace halvox::platform::linux_ {

// Receives SIGTERM, SIGINT and SIGUSR1 as events of a loop (signalfd). The functions that it calls
// may do anything, whereas a real signal handler may do little more than set a flag. Belongs to the
// loop's thread.
class SignalWatch final : public EventSource {
 public:
  // Blocks the three signals in this thread and in those that it starts from now on.
  static void block();

  // SIGTERM and SIGINT call `onEnd`. SIGUSR1 calls `onReport`, which may be empty.
  SignalWatch(std::function<void()> onEnd, std::function<void()> onReport);
  // Returns false if the system has no descriptor left.
  [[nodiscard]] bool start(EventLoop& loop);
  void onReady(std::uint32_t events) override;

 private:
  std::function<void()> onEnd_;
  std::function<void()> onReport_;
  UniqueFd fd_;
};

}  // namespace halvox::platform::linux_
