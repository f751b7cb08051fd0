#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

#include "tools/top/TopSnapshot.h"

// What `halvoxctl status` shows, as plain values. A number that is not known is empty.
namespace halvox::tools {

// What the service itself costs, as the kernel counts it.
struct ServiceCost {
  std::optional<double> cpuSeconds{};
  // How often the threads that still run have waited since the start.
  std::optional<std::uint64_t> wakeUps{};
  // To the disk. The kernel shows this number only to the service's user and to root.
  std::optional<std::uint64_t> bytesWritten{};
};

// Something that is off, and the setting or the option of the build that says so.
struct SwitchedOff {
  std::string what;
  std::string why;
};

struct ServicePlaces {
  std::string configuration;
  bool hasConfiguration = false;  // without the file all settings have their defaults
  std::string socket;             // empty if only the usual places are known
  std::string database;
  std::string summaries;
  std::string captures;
};

struct ServiceStatus {
  double now = 0;       // seconds since 1970
  std::string version;  // of this program
  // From the service: its figures, with rates as means since its start, and what it lost. Without a
  // service, `service.problem` says why.
  TopService service;
  std::vector<TopLoss> losses;
  std::optional<std::int64_t> process;
  ServiceCost cost;
  ServicePlaces places;
  std::optional<std::uint64_t> summaryBytes;
  std::optional<std::uint64_t> captureBytes;
  std::uint64_t storeLimitBytes = 0;
  std::uint32_t retentionDays = 0;
  std::uint32_t keptCaptures = 0;
  std::vector<SwitchedOff> off;
};

}  // namespace halvox::tools
