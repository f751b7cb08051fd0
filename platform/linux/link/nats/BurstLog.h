#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <utility>

namespace halvox::platform::linux_ {

// Limits the log lines of a burst of failures: the first failure gets a line, then at most one line
// a second that stands for all failures since the line before. Not thread-safe: the owner locks.
class BurstLog {
 public:
  using Time = std::chrono::steady_clock::time_point;

  // Adds failures. Returns how many the caller shall log now; std::nullopt if it shall log nothing.
  [[nodiscard]] std::optional<std::uint64_t> note(std::uint64_t failures, Time now) {
    unlogged_ += failures;
    if (last_ && now - *last_ < kPause) return std::nullopt;
    last_ = now;
    return std::exchange(unlogged_, 0);
  }

 private:
  static constexpr std::chrono::seconds kPause{1};
  std::uint64_t unlogged_ = 0;
  std::optional<Time> last_;
};

}  // namespace halvox::platform::linux_
