#include "platform/fake/FakeIOReportDelta.h"

#include <algorithm>
#include <limits>

namespace halvox::platform {
namespace {

using Channel = FakeIOReportService::Channel;
using States = std::vector<IOReportState>;
using Buckets = std::vector<IOReportBucket>;

bool isSameState(const IOReportState& one, const IOReportState& other) {
  return one.name == other.name;
}

bool isSameBucket(const IOReportBucket& one, const IOReportBucket& other) {
  return one.lower == other.lower && one.upper == other.upper &&
         one.boundsResult == other.boundsResult;
}

bool isSame(const Channel& one, const Channel& other) {
  return areNamedAlike(one, other) && one.kind == other.kind && one.unitLabel == other.unitLabel &&
         std::ranges::equal(one.states, other.states, isSameState) &&
         std::ranges::equal(one.buckets, other.buckets, isSameBucket);
}

std::int64_t gaugeDifference(std::int64_t previous, std::int64_t current) {
  using Limits = std::numeric_limits<std::int64_t>;
  if (previous < 0 && current > Limits::max() + previous) return Limits::max();
  if (previous > 0 && current < Limits::min() + previous) return Limits::min();
  return current - previous;
}

std::int64_t difference(const Channel& previous, const Channel& current) {
  if (current.kind == IOReportKind::kGauge) {
    return gaugeDifference(previous.integerValue, current.integerValue);
  }
  const bool isReset = current.integerValue < previous.integerValue;
  return isReset ? current.integerValue : current.integerValue - previous.integerValue;
}

void subtract(const States& previous, States& current) {
  bool isReset = false;
  for (std::size_t index = 0; index < current.size(); ++index) {
    isReset = isReset || current[index].inTransitions < previous[index].inTransitions ||
              current[index].residency < previous[index].residency;
  }
  std::uint64_t total = 0;
  for (std::size_t index = 0; index < current.size(); ++index) {
    if (!isReset) {
      current[index].inTransitions -= previous[index].inTransitions;
      current[index].residency -= previous[index].residency;
    }
    total += current[index].residency;
  }
  for (IOReportState& state : current) {
    state.dutyCycle =
        total == 0 ? 0 : static_cast<double>(state.residency) / static_cast<double>(total);
  }
}

void subtract(const Buckets& previous, Buckets& current) {
  bool isReset = false;
  for (std::size_t index = 0; index < current.size(); ++index) {
    isReset = isReset || current[index].hits < previous[index].hits;
  }
  for (std::size_t index = 0; index < current.size() && !isReset; ++index) {
    current[index].hits -= previous[index].hits;
  }
}

void setExtremes(Channel& channel) {
  const auto isHit = [](const IOReportBucket& bucket) { return bucket.hits > 0; };
  const auto lowest = std::ranges::find_if(channel.buckets, isHit);
  const auto highest = std::find_if(channel.buckets.rbegin(), channel.buckets.rend(), isHit);
  const bool hasHits = lowest != channel.buckets.end();
  channel.minValue = hasHits ? lowest->lower : 0;
  channel.maxValue = 0;
  if (!hasHits) return;
  const bool isOpen = highest->upper == kIOReportNoUpperBound;
  channel.maxValue = isOpen ? highest->lower : highest->upper;
}

}  // namespace

bool areNamedAlike(const Channel& one, const Channel& other) {
  return one.format == other.format && one.driverName == other.driverName &&
         one.group == other.group && one.subGroup == other.subGroup &&
         one.channelName == other.channelName;
}

FakeIOReportService::ChannelList differences(const FakeIOReportService::ChannelList& previous,
                                             const FakeIOReportService::ChannelList& current) {
  FakeIOReportService::ChannelList result;
  for (const Channel& now : current) {
    const auto before = std::ranges::find_if(
        previous, [&now](const Channel& channel) { return isSame(channel, now); });
    if (before == previous.end()) continue;
    Channel& changed = result.emplace_back(now);
    changed.integerValue = difference(*before, now);
    subtract(before->states, changed.states);
    subtract(before->buckets, changed.buckets);
    setExtremes(changed);
  }
  return result;
}

}  // namespace halvox::platform
