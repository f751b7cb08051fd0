#pragma once

#include <chrono>
#include <optional>

namespace halvox::pipewire_reporter {

// Adds up what one stream lost, and decides when to report it: at once, but at most once a second.
// A plain value that belongs to the loop thread. All times are of one clock.
class XrunMeter {
 public:
  using Time = std::chrono::nanoseconds;
  using Seconds = std::chrono::duration<double>;

  static constexpr std::chrono::seconds kDistance{1};

  // The stream missed the cycle that began at `cycle` and lasted `lost`. PipeWire's profiler
  // reports a missed cycle twice in a row; the second report is ignored.
  void add(Time cycle, Seconds lost);
  // Returns what was lost since the last report, if anything was and a report is due. A report is
  // also due when the clock was set back, which would otherwise delay it for an unknown time.
  [[nodiscard]] std::optional<Seconds> takeDue(Time now);
  // Returns what was lost since the last report, due or not. For a stream that ends.
  [[nodiscard]] std::optional<Seconds> takeRest();

 private:
  Seconds lost_{0};
  std::optional<Time> lastCycle_;
  std::optional<Time> lastReport_;
};

}  // namespace halvox::pipewire_reporter
