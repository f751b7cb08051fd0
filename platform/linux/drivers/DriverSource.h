#pragma once

#include <memory>
#include <string_view>

#include "platform/linux/drivers/DriverChannel.h"

namespace halvox::platform::linux_ {

// A source of driver counters.
//
// Its SourceReader owns it and calls it on a thread that serves only this source. A source that
// waits for a disk or a driver therefore delays no other source. If a source cannot read something,
// it logs that and skips it in the reading.
class DriverSource {
 public:
  DriverSource() = default;
  DriverSource(const DriverSource&) = delete;
  DriverSource& operator=(const DriverSource&) = delete;
  virtual ~DriverSource() = default;

  // Names the source in log lines and counters, such as "alsa".
  [[nodiscard]] virtual std::string_view name() const = 0;
  // Prepares the source. May wait for a server's answer, because the first reading decides which
  // channels sessions can subscribe to. Called once, before any reading.
  virtual void open() {}
  // All channels that exist now, and their values. Never null; empty if there are none. What cannot
  // be read is skipped and logged by the source.
  [[nodiscard]] virtual std::shared_ptr<const Reading> read() = 0;
  // Reports that the last reading was a sample of a session. Not called for readings that only find
  // out which channels exist. Called after the waiting threads have received the reading. No
  // session therefore waits for this call.
  virtual void sampled() {}
};

}  // namespace halvox::platform::linux_
