#pragma once

#include <cstdint>
#include <functional>

#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/connection/EventLoop.h"

namespace halvox::platform::linux_ {

// Hears SIGTERM and SIGINT, and SIGUSR1, as events of a loop. Belongs to the loop's thread.
class SignalWatch final : public EventSource {
 public:
  // Keeps the three signals away from this thread and from those that it starts from now on.
  static void block();

  // SIGUSR1 calls `onReport`, which may be empty.
  SignalWatch(std::function<void()> onEnd, std::function<void()> onReport);
  // False when the system gave no descriptor for it.
  [[nodiscard]] bool start(EventLoop& loop);
  void onReady(std::uint32_t events) override;

 private:
  std::function<void()> onEnd_;
  std::function<void()> onReport_;
  UniqueFd fd_;
};

}  // namespace halvox::platform::linux_
