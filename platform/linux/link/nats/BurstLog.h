#pragma once

#include <chrono>
#include <cstdint>
#include <optional>
#include <utility>

namespace halvox::platform::linux_ {

// Decides which failures of a burst are worth a line: the first, then one a second with the number
// of all since. Belongs to whoever locks around it.
class BurstLog {
 public:
  using Time = std::chrono::steady_clock::time_point;

  // How many failures the line stands for; none when there shall be no line now.
  [[nodiscard]] std::optional<std::uint64_t> note(std::uint64_t failures, Time now) {
    unsaid_ += failures;
    if (last_ && now - *last_ < kPause) return std::nullopt;
    last_ = now;
    return std::exchange(unsaid_, 0);
  }

 private:
  static constexpr std::chrono::seconds kPause{1};
  std::uint64_t unsaid_ = 0;
  std::optional<Time> last_;
};

}  // namespace halvox::platform::linux_
