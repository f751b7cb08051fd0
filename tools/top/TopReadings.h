#pragma once

#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <vector>

// What `halvoxctl top` reads in one turn besides the stored records.
namespace halvox::tools {

// What a device counted since the reading before. The first reading has no counts.
struct DeviceReading {
  std::string name;
  std::optional<std::uint64_t> cycles{};
  std::optional<std::uint64_t> frames{};
  std::optional<std::uint64_t> xruns{};
  std::optional<double> busySeconds{};
  // Gauges.
  std::optional<std::int64_t> quantum{};
  std::optional<std::int64_t> rate{};
};

// The counters of the service by "piece, name".
using CounterValues = std::map<std::string, std::uint64_t>;

struct TopReadings {
  double now = 0;     // seconds since 1970
  double steady = 0;  // seconds by a clock that is never set
  std::optional<CounterValues> counters;
  std::optional<std::uint64_t> sessions;
  std::optional<double> uptimeSeconds;
  std::optional<std::uint64_t> storeBytes;
  bool isConnected = false;
  std::string problem;
  std::vector<DeviceReading> devices;
};

}  // namespace halvox::tools
