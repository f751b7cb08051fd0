#pragma once

#include <chrono>
#include <optional>

namespace halvox::pipewire_reporter {

// Adds up what one stream lost, and says when that is to be reported: at once, but not sooner than
// a second after the report before. Of the loop thread; times are those of one clock.
class XrunMeter {
 public:
  using Time = std::chrono::nanoseconds;
  using Seconds = std::chrono::duration<double>;

  static constexpr std::chrono::seconds kDistance{1};

  // The stream missed the cycle of that time and length. PipeWire's profiler tells of a missed
  // cycle twice, one right after the other; the second time does not count.
  void add(Time cycle, Seconds lost);
  // What was lost since the last report, if there is any and a report is due. The clock may have
  // been set back: then one is.
  [[nodiscard]] std::optional<Seconds> takeDue(Time now);
  // The same for a stream that ends: due or not.
  [[nodiscard]] std::optional<Seconds> takeRest();

 private:
  Seconds lost_{0};
  std::optional<Time> lastCycle_;
  std::optional<Time> lastReport_;
};

}  // namespace halvox::pipewire_reporter
