#include "platform/linux/drivers/DriverSamples.h"

#include <limits>
#include <span>
#include <unordered_map>
#include <utility>

namespace halvox::platform::linux_ {
namespace {

using Numbers = std::span<const std::uint64_t>;

std::optional<std::string_view> view(const std::optional<std::string>& text) {
  if (!text.has_value()) return std::nullopt;
  return *text;
}

std::int64_t asSigned(std::uint64_t number) { return static_cast<std::int64_t>(number); }

Numbers valuesOf(const Reading& reading, std::size_t index) {
  const ChannelList& channels = *reading.channels;
  return Numbers(reading.values).subspan(channels.offset(index), channels[index]->valueCount());
}

std::vector<IOReportState> statesOf(const ChannelDescription& channel, Numbers values) {
  std::uint64_t total = 0;
  for (std::size_t index = 0; index < channel.states.size(); ++index) {
    total += values[2 * index + 1];
  }
  std::vector<IOReportState> states;
  states.reserve(channel.states.size());
  for (std::size_t index = 0; index < channel.states.size(); ++index) {
    const std::uint64_t residency = values[2 * index + 1];
    states.push_back(
        {.name = channel.states[index],
         .inTransitions = values[2 * index],
         .residency = residency,
         // The state's share of the time.
         .dutyCycle =
             total == 0 ? 0 : static_cast<double>(residency) / static_cast<double>(total)});
  }
  return states;
}

std::vector<IOReportBucket> bucketsOf(const ChannelDescription& channel, Numbers values) {
  std::vector<IOReportBucket> buckets;
  buckets.reserve(channel.buckets.size());
  for (std::size_t index = 0; index < channel.buckets.size(); ++index) {
    const BucketBounds& bounds = channel.buckets[index];
    buckets.push_back({.lower = bounds.lower, .upper = bounds.upper, .hits = values[index]});
  }
  return buckets;
}

struct Extremes {
  std::int64_t minimum = 0;
  std::int64_t maximum = 0;
};

// The bounds of the lowest and of the highest bucket with hits. Values in an open bucket are at
// least its lower bound; nothing more is known about them.
Extremes extremesOf(std::span<const IOReportBucket> buckets) {
  Extremes extremes;
  bool isFirst = true;
  for (const IOReportBucket& bucket : buckets) {
    if (bucket.hits == 0) continue;
    if (std::exchange(isFirst, false)) extremes.minimum = bucket.lower;
    extremes.maximum = bucket.upper == kIOReportNoUpperBound ? bucket.lower : bucket.upper;
  }
  return extremes;
}

int show(const ChannelDescription& channel, Numbers values,
         const IOReportService::Visitor& visitor) {
  IOReportChannel shown{.format = channel.format,
                        .driverName = view(channel.driverName),
                        .group = view(channel.group),
                        .subGroup = view(channel.subGroup),
                        .channelName = view(channel.channelName),
                        .unitLabel = channel.unitLabel};
  std::vector<IOReportState> states;
  std::vector<IOReportBucket> buckets;
  if (channel.format == IOReportFormat::kSimple) {
    shown.integerValue = asSigned(values[0]);
  } else if (channel.format == IOReportFormat::kState) {
    states = statesOf(channel, values);
    shown.states = states;
  } else if (channel.format == IOReportFormat::kHistogram) {
    buckets = bucketsOf(channel, values);
    const Extremes extremes = extremesOf(buckets);
    shown.buckets = buckets;
    shown.minValue = extremes.minimum;
    shown.maxValue = extremes.maximum;
  }
  return visitor(shown);
}

// The values of each channel, by its address, which is the channel's identity.
using ValuesByChannel = std::unordered_map<const ChannelDescription*, Numbers>;

// With this index, each channel of the current samples needs one look-up, whatever the order of the
// previous samples.
ValuesByChannel index(const DriverSamples& samples) {
  ValuesByChannel values;
  for (const auto& [reading, selection] : samples.parts()) {
    for (const std::uint32_t position : *selection) {
      values.emplace((*reading->channels)[position].get(), valuesOf(*reading, position));
    }
  }
  return values;
}

// Limit the difference to what 64 bits hold, because a difference that wraps around would turn a
// fall into a rise.
std::uint64_t gaugeDifference(std::uint64_t previous, std::uint64_t current) {
  std::int64_t difference = 0;
  if (__builtin_sub_overflow(asSigned(current), asSigned(previous), &difference)) {
    difference = asSigned(current) < asSigned(previous) ? std::numeric_limits<std::int64_t>::min()
                                                        : std::numeric_limits<std::int64_t>::max();
  }
  return static_cast<std::uint64_t>(difference);
}

void appendDifference(const ChannelDescription& channel, Numbers previous, Numbers current,
                      std::vector<std::uint64_t>& differences) {
  if (channel.format == IOReportFormat::kSimple && channel.kind == IOReportKind::kGauge) {
    differences.push_back(gaugeDifference(previous[0], current[0]));
    return;
  }
  // The numbers of a channel belong together: if one was reset, all of them were.
  bool isReset = false;
  for (std::size_t number = 0; number < current.size(); ++number) {
    isReset |= current[number] < previous[number];
  }
  for (std::size_t number = 0; number < current.size(); ++number) {
    // After a reset, everything that a counter has counted since belongs to the session.
    differences.push_back(isReset ? current[number] : current[number] - previous[number]);
  }
}

// True for a state channel in whose difference every state has a residency of 0, such as the
// channel of a node that disappeared before the session.
bool hadNoState(const ChannelDescription& channel, Numbers differences) {
  if (channel.format != IOReportFormat::kState) return false;
  for (std::size_t number = 1; number < differences.size(); number += 2) {
    if (differences[number] != 0) return false;
  }
  return true;
}

}  // namespace

void DriverSamples::iterate(const IOReportService::Visitor& visitor) const {
  for (const auto& [reading, selection] : parts_) {
    for (const std::uint32_t position : *selection) {
      if (show(*(*reading->channels)[position], valuesOf(*reading, position), visitor) != 0) return;
    }
  }
}

std::shared_ptr<const DriverSamples> makeDelta(const DriverSamples& previous,
                                               const DriverSamples& current) {
  const ValuesByChannel before = index(previous);
  std::vector<ChannelList::Channel> channels;
  auto reading = std::make_shared<Reading>();
  for (const auto& [now, selection] : current.parts()) {
    for (const std::uint32_t position : *selection) {
      const ChannelList::Channel& channel = (*now->channels)[position];
      const auto found = before.find(channel.get());
      // Skip a channel that appeared after the first sample, because its values may include counts
      // from before that sample.
      if (found == before.end()) continue;
      const std::size_t begin = reading->values.size();
      appendDifference(*channel, found->second, valuesOf(*now, position), reading->values);
      // Skip a state channel without residencies, because its report would be an empty text.
      if (hadNoState(*channel, Numbers(reading->values).subspan(begin))) {
        reading->values.resize(begin);
        continue;
      }
      channels.push_back(channel);
    }
  }
  auto all = std::make_shared<ChannelSelection>(channels.size());
  for (std::size_t position = 0; position < all->size(); ++position) {
    (*all)[position] = static_cast<std::uint32_t>(position);
  }
  reading->channels = std::make_shared<ChannelList>(std::move(channels));
  return std::make_shared<DriverSamples>(
      std::vector<DriverSamples::Part>{{std::move(reading), std::move(all)}});
}

}  // namespace halvox::platform::linux_
