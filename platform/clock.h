#pragma once

#include <chrono>

#include "platform/value.h"

namespace halvox::platform {

// A point in time as people of one place write it.
struct LocalTime {
  int year = 1970;
  int month = 1;  // from 1
  int day = 1;    // from 1
  int hour = 0;
  int minute = 0;
  int second = 0;                         // up to 60
  std::chrono::minutes offsetFromUTC{0};  // what was added to UTC
  friend bool operator==(const LocalTime&, const LocalTime&) = default;
};

// The clocks of the platform. Any thread may ask; nothing blocks.
class ClockService {
 public:
  virtual ~ClockService() = default;

  // The wall clock; it may be set back while the process runs.
  [[nodiscard]] virtual Date currentDate() const = 0;
  // A date in the time zone of the platform; one that is beyond its calendar gives 1970.
  [[nodiscard]] virtual LocalTime localTime(Date date) const = 0;
  // Time since the system started.
  [[nodiscard]] virtual std::chrono::duration<double> systemUptime() const = 0;
  // Time that this process has run.
  [[nodiscard]] virtual std::chrono::milliseconds processUptime() const = 0;
};

}  // namespace halvox::platform
