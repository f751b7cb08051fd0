#include "reporters/pipewire/XrunMeter.h"

#include <algorithm>
#include <utility>

namespace halvox::pipewire_reporter {

void XrunMeter::add(const DeviceXrun& xrun) {
  lost_ += xrun.lost;
  cycles_ += xrun.cycles;
  if (xrun.late.empty()) count(xrun, XrunRole::kUnknown, {});
  for (const LateNode& node : xrun.late) count(xrun, roleOf(node, xrun.driver), node);
}

std::optional<XrunReport> XrunMeter::takeDue(Time now) {
  // A time before the last report means that the clock was set back.
  if (lastReport_.has_value() && now >= *lastReport_ && now - *lastReport_ < kDistance) {
    return std::nullopt;
  }
  auto report = takeRest();
  if (report.has_value()) lastReport_ = now;
  return report;
}

std::optional<XrunReport> XrunMeter::takeRest() {
  auto tallies = std::exchange(tallies_, {});
  const Seconds lost = std::exchange(lost_, Seconds{0});
  const std::int64_t cycles = std::exchange(cycles_, 0);
  if (tallies.empty()) return std::nullopt;
  // The first of the greatest.
  const auto most = std::ranges::max_element(tallies, {}, [](const Tally& tally) {
    return std::pair(tally.cycles, tally.role == XrunRole::kCulprit);
  });
  return XrunReport{.lost = lost,
                    .cycles = cycles,
                    .device = std::move(most->device),
                    .quantum = most->quantum,
                    .rate = most->rate,
                    .role = most->role,
                    .late = std::move(most->node)};
}

void XrunMeter::count(const DeviceXrun& xrun, XrunRole role, const LateNode& node) {
  auto found = std::ranges::find_if(tallies_, [&](const Tally& tally) {
    // A server gives the ID of a node that has disappeared to another one, which rarely has the
    // same name.
    return tally.role == role && tally.node.id == node.id && tally.node.name == node.name;
  });
  if (found == tallies_.end()) {
    if (tallies_.size() == kMaxLateNodes) return;
    tallies_.push_back({.role = role, .node = node});
    found = std::prev(tallies_.end());
  }
  // It may have become known since, or have disappeared and be unknown now.
  if (!found->node.serial.has_value()) found->node = node;
  found->cycles += xrun.cycles;
  found->device = xrun.device;
  found->quantum = xrun.quantum;
  found->rate = xrun.rate;
}

XrunRole XrunMeter::roleOf(const LateNode& node, GlobalID driver) const {
  // Before the comparison with the stream: a stream can drive a graph itself.
  if (node.id == driver) return XrunRole::kDevice;
  return node.id == stream_ ? XrunRole::kCulprit : XrunRole::kVictim;
}

}  // namespace halvox::pipewire_reporter
