#pragma once

#include <chrono>

#include "platform/clock.h"

namespace halvox::platform::linux_ {

// The clocks of the C library. Uptimes include the time in which the machine was suspended.
//
// Any thread may call; nothing fails. The platform owns it, and makes it early: if the start time
// of the process cannot be read, processUptime() counts from the constructor.
class LibcClockService final : public ClockService {
 public:
  LibcClockService();

  [[nodiscard]] Date currentDate() const override;
  [[nodiscard]] LocalTime localTime(Date date) const override;
  [[nodiscard]] std::chrono::duration<double> systemUptime() const override;
  [[nodiscard]] std::chrono::milliseconds processUptime() const override;

 private:
  const std::chrono::nanoseconds processStart_;  // measured from the start of the system
};

}  // namespace halvox::platform::linux_
