#pragma once

#include <chrono>

#include "platform/clock.h"

namespace halvox::platform::linux_ {

// The clocks of the C library. Uptimes count while the machine sleeps too.
// Make it early: where the kernel does not tell when the process started, that moment counts.
class LibcClockService final : public ClockService {
 public:
  LibcClockService();

  [[nodiscard]] Date currentDate() const override;
  [[nodiscard]] LocalTime localTime(Date date) const override;
  [[nodiscard]] std::chrono::duration<double> systemUptime() const override;
  [[nodiscard]] std::chrono::milliseconds processUptime() const override;

 private:
  const std::chrono::nanoseconds processStart_;  // since the system started
};

}  // namespace halvox::platform::linux_
