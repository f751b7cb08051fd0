#include "platform/linux/testing/Eventually.h"

#include <thread>
#include <utility>

namespace halvox::platform::linux_ {

bool eventually(const std::function<bool()>& condition, const std::function<void()>& turn) {
  const auto deadline = std::chrono::steady_clock::now() + kTestDeadline;
  while (!condition()) {
    if (std::chrono::steady_clock::now() > deadline) return false;
    if (turn) {
      turn();
    } else {
      std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
  }
  return true;
}

bool staysQuiet(const std::function<long()>& count, std::chrono::milliseconds time) {
  constexpr std::chrono::milliseconds kSettling{100};
  constexpr std::chrono::milliseconds kLookEvery{20};
  long settled = count();
  const auto hasSettled = [&] {
    std::this_thread::sleep_for(kSettling);
    const long last = std::exchange(settled, count());
    return last == settled;
  };
  if (!eventually(hasSettled)) return false;

  const auto end = std::chrono::steady_clock::now() + time;
  while (std::chrono::steady_clock::now() < end) {
    std::this_thread::sleep_for(kLookEvery);
    if (count() != settled) return false;
  }
  return true;
}

}  // namespace halvox::platform::linux_
