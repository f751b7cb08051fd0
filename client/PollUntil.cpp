#include "client/PollUntil.h"

#include <algorithm>

namespace halvox::client {

bool pollUntil(std::span<pollfd> polled, std::chrono::steady_clock::time_point deadline) {
  using Clock = std::chrono::steady_clock;
  timespec remaining{};
  const bool forEver = deadline == Clock::time_point::max();
  if (!forEver) {
    const auto left = std::max(deadline - Clock::now(), Clock::duration::zero());
    const auto seconds = std::chrono::duration_cast<std::chrono::seconds>(left);
    remaining = {.tv_sec = seconds.count(), .tv_nsec = (left - seconds).count()};
  }
  return ppoll(polled.data(), polled.size(), forEver ? nullptr : &remaining, nullptr) > 0;
}

}  // namespace halvox::client
