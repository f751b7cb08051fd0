#include "reporters/pipewire/XrunMeter.h"

#include <utility>

namespace halvox::pipewire_reporter {

void XrunMeter::add(Time cycle, Seconds lost) {
  if (std::exchange(lastCycle_, cycle) != cycle) lost_ += lost;
}

std::optional<XrunMeter::Seconds> XrunMeter::takeDue(Time now) {
  // A time before the last report means that the clock was set back.
  if (lastReport_.has_value() && now >= *lastReport_ && now - *lastReport_ < kDistance) {
    return std::nullopt;
  }
  auto lost = takeRest();
  if (lost.has_value()) lastReport_ = now;
  return lost;
}

std::optional<XrunMeter::Seconds> XrunMeter::takeRest() {
  const Seconds lost = std::exchange(lost_, Seconds{0});
  return lost > Seconds{0} ? std::optional(lost) : std::nullopt;
}

}  // namespace halvox::pipewire_reporter
