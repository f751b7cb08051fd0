#pragma once

#include <chrono>
#include <mutex>

#include "platform/clock.h"

namespace halvox::platform {

// Clocks that stand still until the test moves them. They start at round numbers that differ from
// each other, so that a test notices when code uses the wrong one. Any thread may call.
// FakePlatform owns it.
class FakeClockService final : public ClockService {
 public:
  // Sets the wall clock, which may go back.
  void setCurrentDate(Date date);
  void setSystemUptime(std::chrono::duration<double> uptime);
  void setProcessUptime(std::chrono::milliseconds uptime);
  // Sets the time zone, which is UTC at first.
  void setOffsetFromUTC(std::chrono::minutes offset);
  // Moves all three clocks forward.
  void advance(std::chrono::nanoseconds by);

  [[nodiscard]] Date currentDate() const override;
  [[nodiscard]] LocalTime localTime(Date date) const override;
  [[nodiscard]] std::chrono::duration<double> systemUptime() const override;
  [[nodiscard]] std::chrono::milliseconds processUptime() const override;

 private:
  mutable std::mutex mutex_;
  Date date_{1'700'000'000.0};
  std::chrono::minutes offsetFromUTC_{0};
  std::chrono::duration<double> systemUptime_{86'400.0};
  std::chrono::nanoseconds processUptime_{std::chrono::seconds(60)};
};

}  // namespace halvox::platform
