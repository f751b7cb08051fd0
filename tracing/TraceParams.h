#pragma once

#include <cstdint>
#include <string>
#include <vector>

namespace halvox {

enum class TraceType : std::int32_t { kKernelTrace = 0, kSignpost = 1 };

enum class TracePointKind : std::uint32_t { kImpulse = 0, kInterval = 1, kLevel = 2 };

// One measurement that a trace parameters file asks for.
struct TraceDataParams {
  std::string name{};
  TracePointKind kind = TracePointKind::kImpulse;
  std::uint32_t beginCode = 0;
  std::uint32_t endCode = 0;  // of an impulse its begin code
  bool matchByThread = false;
};

// What a trace parameters file says.
struct TraceParams {
  std::string name{};
  TraceType type = TraceType::kKernelTrace;
  std::vector<TraceDataParams> tracePoints{};
};

}  // namespace halvox
