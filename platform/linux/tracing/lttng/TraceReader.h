#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <optional>
#include <string>

#include "platform/ktrace.h"

namespace halvox::platform::linux_ {

// Converts ticks of a trace's clock into time. A plain value.
struct TraceClock {
  std::uint64_t ticksPerSecond = 1'000'000'000;
  std::int64_t offsetSeconds = 0;  // from 1970 to tick 0
  std::uint64_t offsetTicks = 0;   // in addition to the seconds

  // Nanoseconds since 1970.
  [[nodiscard]] std::uint64_t toNanoseconds(std::uint64_t ticks) const;
};

// The result of reading a trace.
struct TraceReading {
  std::uint64_t events = 0;
  std::uint64_t lost = 0;         // events for which the tracer's buffers were full
  std::uint64_t lostPackets = 0;  // each with an unknown number of events
  std::optional<std::string> failure{};
};

// Receives the content of a trace, on the thread that reads it.
struct TraceListener {
  std::function<void(const TraceClock&)> onClock;   // at most once, before the first event
  std::function<bool(const trace_point&)> onEvent;  // returns false to end the reading
};

// Reads all "halvox:kdebug" events of the traces below a directory, in the order of their times.
// Blocks on the disk, and as long as the listener takes. A directory without traces has no events,
// which is not a failure. Any thread may call; each reading has a graph of its own.
[[nodiscard]] TraceReading readTraces(const std::filesystem::path& directory,
                                      const TraceListener& listener);

}  // namespace halvox::platform::linux_
