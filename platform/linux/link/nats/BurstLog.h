#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <utility>

namespace halvox::platform::linux_ {

// Limits the log lines of a burst of failures. The first failure gets a line. After it, there is at
// most one line a second, which covers all failures since the previous line. Not thread-safe; the
// owner must hold a lock.
class BurstLog {
 public:
  using Time = std::chrono::steady_clock::time_point;

  // Adds failures. Returns how many failures the caller must log now; std::nullopt if it must not
  // log.
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
