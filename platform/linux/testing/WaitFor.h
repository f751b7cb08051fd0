#pragma once

#include <chrono>
#include <functional>
#include <thread>

namespace halvox::platform::linux_ {

// Longer than any test waits for what should happen at once.
inline constexpr std::chrono::seconds kTestDeadline{20};

// Waits until the condition holds; false when it does not in time. Looks again and again, since
// conditions are made of whatever the test can see.
inline bool waitFor(const std::function<bool()>& condition) {
  const auto deadline = std::chrono::steady_clock::now() + kTestDeadline;
  while (!condition()) {
    if (std::chrono::steady_clock::now() > deadline) return false;
    std::this_thread::sleep_for(std::chrono::microseconds(200));
  }
  return true;
}

}  // namespace halvox::platform::linux_
