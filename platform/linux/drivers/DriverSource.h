#pragma once

#include <memory>
#include <string_view>

#include "platform/linux/drivers/DriverChannel.h"

namespace halvox::platform::linux_ {

// One place that driver counters come from. The registry owns it and calls it on one thread that is
// the source's own, so a source that waits delays no other.
class DriverSource {
 public:
  DriverSource() = default;
  DriverSource(const DriverSource&) = delete;
  DriverSource& operator=(const DriverSource&) = delete;
  virtual ~DriverSource() = default;

  // For log lines and counters: "alsa".
  [[nodiscard]] virtual std::string_view name() const = 0;
  // The first reading, which decides whether there is anything to subscribe to, may wait this long
  // for a server to answer. Called once, before any reading.
  virtual void open() {}
  // All channels that there are now and their values. Never null; empty when there is nothing. What
  // cannot be read is left out and logged by the source.
  [[nodiscard]] virtual std::shared_ptr<const Reading> read() = 0;
};

}  // namespace halvox::platform::linux_
