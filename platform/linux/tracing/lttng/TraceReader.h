#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <optional>
#include <string>

#include "platform/ktrace.h"

namespace halvox::platform::linux_ {

// What turns the ticks of a trace's clock into time.
struct TraceClock {
  std::uint64_t ticksPerSecond = 1'000'000'000;
  std::int64_t offsetSeconds = 0;  // from 1970 to tick 0
  std::uint64_t offsetTicks = 0;   // to be added to these

  // Since 1970.
  [[nodiscard]] std::uint64_t toNanoseconds(std::uint64_t ticks) const;
};

// What is told about a trace that has been read.
struct TraceReading {
  std::uint64_t events = 0;
  std::uint64_t lost = 0;         // events that found no room in the tracer's buffers
  std::uint64_t lostPackets = 0;  // of unknown numbers of events
  std::optional<std::string> failure{};
};

// Hears what a trace holds, on the thread that reads it.
struct TraceListener {
  std::function<void(const TraceClock&)> onClock;   // at most once, before the first event
  std::function<bool(const trace_point&)> onEvent;  // false: no more is wanted
};

// Reads all "halvox:kdebug" events of the traces below a directory, in the order of their times.
// Blocks for the disk and as long as the listener takes. A directory without traces has no events.
[[nodiscard]] TraceReading readTraces(const std::filesystem::path& directory,
                                      const TraceListener& listener);

}  // namespace halvox::platform::linux_
