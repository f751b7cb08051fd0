#include "platform/linux/drivers/pipewire/NodeStatistics.h"

#include <algorithm>
#include <span>
#include <utility>

#include "platform/linux/drivers/pipewire/NodeChannel.h"

namespace halvox::platform::linux_ {
namespace {

using std::chrono::duration_cast;
using std::chrono::microseconds;

constexpr const char* kMicroseconds = "us";

ChannelList::Channel makeSimple(const std::string& group, const std::string& driver,
                                std::string name) {
  return makeChannel(describeNodeChannel(group, driver, std::move(name)));
}

// A sink and a source may have one name. Their group is therefore the subgroup here.
ChannelList::Channel makeGauge(const std::string& group, const std::string& driver,
                               std::string name, std::string unit) {
  ChannelDescription channel = describeNodeChannel(kClockGroup, driver, std::move(name));
  channel.subGroup = group;
  channel.kind = IOReportKind::kGauge;
  channel.unitLabel = std::move(unit);
  return makeChannel(std::move(channel));
}

ChannelList::Channel makeHistogram(const std::string& group, const std::string& driver,
                                   std::string name) {
  ChannelDescription channel = describeNodeChannel(group, driver, std::move(name));
  channel.format = IOReportFormat::kHistogram;
  channel.unitLabel = kMicroseconds;
  channel.buckets = DurationHistogram::bounds();
  return makeChannel(std::move(channel));
}

ChannelList::Channel makeState(const std::string& group, const std::string& driver,
                               std::string name) {
  ChannelDescription channel = describeNodeChannel(group, driver, std::move(name));
  channel.format = IOReportFormat::kState;
  channel.unitLabel = kMicroseconds;
  channel.states = StateResidency::names();
  return makeChannel(std::move(channel));
}

}  // namespace

std::vector<BucketBounds> DurationHistogram::bounds() {
  std::vector<BucketBounds> bounds;
  for (std::size_t index = 0; index < kBuckets; ++index) {
    const bool isLast = index + 1 == kBuckets;
    bounds.push_back({.lower = kLowerBounds[index],
                      .upper = isLast ? kIOReportNoUpperBound : kLowerBounds[index + 1]});
  }
  return bounds;
}

void DurationHistogram::add(std::chrono::nanoseconds duration) {
  const std::int64_t value =
      std::max<std::int64_t>(0, duration_cast<microseconds>(duration).count());
  const auto* const next = std::ranges::upper_bound(kLowerBounds, value);
  ++hits_[static_cast<std::size_t>(next - kLowerBounds.begin()) - 1];
}

// In the order of NodeState.
std::vector<std::string> StateResidency::names() { return {"running", "idle", "suspended"}; }

void StateResidency::change(std::optional<NodeState> state, Time now) {
  if (isKnown_ && state == state_) return;
  if (state_.has_value()) totals_[static_cast<std::size_t>(*state_)].time += now - since_;
  // Do not count the first known state as a transition, because the node may have been in it for
  // hours.
  if (state.has_value() && isKnown_) ++totals_[static_cast<std::size_t>(*state)].transitions;
  state_ = state;
  since_ = now;
  isKnown_ = true;
}

void StateResidency::leave(Time now) {
  change(std::nullopt, now);
  isKnown_ = false;
}

std::array<std::uint64_t, 2 * StateResidency::kStates> StateResidency::values(Time now) const {
  std::array<std::uint64_t, 2 * kStates> values{};
  for (std::size_t index = 0; index < kStates; ++index) {
    std::chrono::nanoseconds time = totals_[index].time;
    if (state_ == static_cast<NodeState>(index)) time += now - since_;
    values[2 * index] = totals_[index].transitions;
    values[2 * index + 1] = static_cast<std::uint64_t>(duration_cast<microseconds>(time).count());
  }
  return values;
}

NodeStatistics::NodeStatistics(const std::string& group, const std::string& driverName)
    : cyclesChannel_(makeSimple(group, driverName, "cycles")),
      xrunsChannel_(makeSimple(group, driverName, "xruns")),
      busyChannel_(makeHistogram(group, driverName, "busy time")),
      waitChannel_(makeHistogram(group, driverName, "wait time")),
      stateChannel_(makeState(group, driverName, "state")),
      quantumChannel_(makeGauge(group, driverName, "quantum", "frames")),
      rateChannel_(makeGauge(group, driverName, "rate", "Hz")) {}

void NodeStatistics::cycleEnded(const pipewire::ProfiledNode& node) {
  ++cycles_;
  if (node.wait.has_value()) wait_.add(*node.wait);
  if (node.busy.has_value()) busy_.add(*node.busy);
}

void NodeStatistics::clockIs(std::int64_t quantum, std::int64_t rate) {
  // A cycle that does not say is no reason to forget what earlier ones said.
  if (quantum <= 0 || rate <= 0) return;
  quantum_ = static_cast<std::uint64_t>(quantum);
  rate_ = static_cast<std::uint64_t>(rate);
}

void NodeStatistics::addTo(ReadingMaker& maker, Time now) const {
  maker.add(cyclesChannel_, std::span(&cycles_, 1));
  maker.add(xrunsChannel_, std::span(&xruns_, 1));
  maker.add(busyChannel_, busy_.values());
  maker.add(waitChannel_, wait_.values());
  maker.add(stateChannel_, states_.values(now));
  if (quantum_ == 0) return;
  maker.add(quantumChannel_, std::span(&quantum_, 1));
  maker.add(rateChannel_, std::span(&rate_, 1));
}

}  // namespace halvox::platform::linux_
