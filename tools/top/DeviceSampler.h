#pragma once

#include <vector>

#include "platform/ioreport.h"
#include "tools/top/TopReadings.h"

namespace halvox::tools {

// Reads what the drivers' channels say about devices. A channel counts for its driver, whatever its
// source is: "cycles", "xruns", "frames" and the histogram "busy time" are counters, "quantum" and
// "rate" are gauges. Other channels are ignored. Belongs to one thread; read() blocks as
// IOReportCreateSamples() does.
class DeviceSampler {
 public:
  // The service must outlive this object.
  explicit DeviceSampler(platform::IOReportService& service) : service_(service) {}

  // Returns the current devices, and what they counted since the last call. The first call returns
  // no counts.
  [[nodiscard]] std::vector<DeviceReading> read();

 private:
  platform::IOReportService& service_;
  platform::IOReportService::Samples last_;
};

}  // namespace halvox::tools
