#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace halvox {

// The numbers are part of the interface, in both enumerations.
enum class TraceType : std::int32_t { kKernelTrace = 0, kSignpost = 1 };

enum class TracePointKind : std::uint32_t { kImpulse = 0, kInterval = 1, kLevel = 2 };

// One measurement that a trace parameters file asks for. A plain value.
struct TraceDataParams {
  std::string name{};
  TracePointKind kind = TracePointKind::kImpulse;
  std::uint32_t beginCode = 0;
  std::uint32_t endCode = 0;  // equal to the begin code for an impulse; 0 for a level
  bool matchByThread = false;
};

// The content of a trace parameters file. A plain value; the session keeps it to trace again.
struct TraceParams {
  std::string name{};
  TraceType type = TraceType::kKernelTrace;
  std::vector<TraceDataParams> tracePoints{};
};

}  // namespace halvox
