#pragma once

#include <chrono>

#include "platform/value.h"

namespace halvox::platform {

// A point in time as a calendar date and time of day in one time zone.
struct LocalTime {
  int year = 1970;
  int month = 1;  // from 1
  int day = 1;    // from 1
  int hour = 0;
  int minute = 0;
  int second = 0;                         // 60 in a leap second
  std::chrono::minutes offsetFromUTC{0};  // local time minus UTC; positive east of Greenwich
  friend bool operator==(const LocalTime&, const LocalTime&) = default;
};

// The clocks of the platform. All code that depends on time reads it from this service, so that
// tests can set it.
//
// Any thread may call; nothing blocks and nothing fails. The composition root owns the service.
class ClockService {
 public:
  virtual ~ClockService() = default;

  // The wall clock. It can jump in both directions while the process runs. Measure intervals with
  // one of the uptimes instead.
  [[nodiscard]] virtual Date currentDate() const = 0;
  // Converts a date to the time zone of the platform. Returns the default LocalTime for a NaN and
  // for a date outside the range of the calendar, because dates come from clients and making a file
  // name from one must not fail.
  [[nodiscard]] virtual LocalTime localTime(Date date) const = 0;
  // Seconds since the system started, including time in which it was suspended.
  [[nodiscard]] virtual std::chrono::duration<double> systemUptime() const = 0;
  // Time since the kernel started this process, including time in which the machine was suspended.
  [[nodiscard]] virtual std::chrono::milliseconds processUptime() const = 0;
};

}  // namespace halvox::platform
