#pragma once

#include <chrono>

#include "platform/value.h"

namespace halvox::platform {

// The clocks of the platform. Any thread may ask; nothing blocks.
class ClockService {
 public:
  virtual ~ClockService() = default;

  // The wall clock; it may be set back while the process runs.
  [[nodiscard]] virtual Date currentDate() const = 0;
  // Time since the system started.
  [[nodiscard]] virtual std::chrono::duration<double> systemUptime() const = 0;
  // Time that this process has run.
  [[nodiscard]] virtual std::chrono::milliseconds processUptime() const = 0;
};

}  // namespace halvox::platform
