#pragma once

#include <atomic>
#include <filesystem>
#include <functional>
#include <map>
#include <memory>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/linux/drivers/DriverSamples.h"
#include "platform/linux/drivers/DriverSource.h"

// Shared by the tests of this folder.
namespace halvox::platform::linux_::testing {

// A source that returns the readings that a test has made.
class MadeSource final : public DriverSource {
 public:
  using Make = std::function<std::shared_ptr<const Reading>()>;
  // `onSampled` is called for each reading that was a sample.
  explicit MadeSource(
      Make make, std::function<void()> onSampled = [] {})
      : make_(std::move(make)), onSampled_(std::move(onSampled)) {}
  [[nodiscard]] std::string_view name() const override { return "made"; }
  [[nodiscard]] std::shared_ptr<const Reading> read() override { return make_(); }
  void sampled() override { onSampled_(); }

 private:
  const Make make_;
  const std::function<void()> onSampled_;
};

// A counter channel.
inline ChannelList::Channel simpleChannel(std::string group, std::string name) {
  ChannelDescription channel;
  channel.kind = IOReportKind::kCounter;
  channel.group = std::move(group);
  channel.channelName = std::move(name);
  return std::make_shared<const ChannelDescription>(std::move(channel));
}

inline ChannelList::Channel gaugeChannel(std::string group, std::string name) {
  ChannelDescription channel = *simpleChannel(std::move(group), std::move(name));
  channel.kind = IOReportKind::kGauge;
  return std::make_shared<const ChannelDescription>(std::move(channel));
}

inline ChannelList::Channel stateChannel(std::vector<std::string> states) {
  ChannelDescription channel;
  channel.format = IOReportFormat::kState;
  channel.states = std::move(states);
  return std::make_shared<const ChannelDescription>(std::move(channel));
}

inline ChannelList::Channel histogramChannel(std::vector<BucketBounds> buckets) {
  ChannelDescription channel;
  channel.format = IOReportFormat::kHistogram;
  channel.buckets = std::move(buckets);
  return std::make_shared<const ChannelDescription>(std::move(channel));
}

inline std::shared_ptr<const Reading> makeReading(std::vector<ChannelList::Channel> channels,
                                                  std::vector<std::uint64_t> values) {
  auto reading = std::make_shared<Reading>();
  reading->channels = std::make_shared<const ChannelList>(std::move(channels));
  reading->values = std::move(values);
  return reading;
}

// Returns a channel as one line:
//   driver/group/subgroup/name unit = the values of its format
inline std::string describe(const IOReportChannel& channel) {
  std::string text;
  for (const auto part : {channel.driverName, channel.group, channel.subGroup}) {
    text += std::string(part.value_or("-")) + "/";
  }
  text += std::string(channel.channelName.value_or("-")) + " " + std::string(channel.unitLabel);
  if (channel.format == IOReportFormat::kSimple) {
    return text + " = " + std::to_string(channel.integerValue);
  }
  text += " =";
  for (const auto& state : channel.states) {
    if (state.inTransitions == 0 && state.residency == 0) continue;
    text += " " + std::string(state.name) + ":" + std::to_string(state.inTransitions) + ":" +
            std::to_string(state.residency);
  }
  for (const auto& bucket : channel.buckets) {
    text += " " + std::to_string(bucket.lower) + "-" + std::to_string(bucket.upper) + ":" +
            std::to_string(bucket.hits);
  }
  if (channel.format == IOReportFormat::kHistogram) {
    text += " min " + std::to_string(channel.minValue) + " max " + std::to_string(channel.maxValue);
  }
  return text;
}

inline std::vector<std::string> describe(const DriverSamples& samples) {
  std::vector<std::string> lines;
  samples.iterate([&lines](const IOReportChannel& channel) {
    lines.push_back(describe(channel));
    return 0;
  });
  return lines;
}

// Returns samples with all channels of a reading.
inline DriverSamples samplesOf(std::shared_ptr<const Reading> reading) {
  auto all = std::make_shared<ChannelSelection>();
  for (std::uint32_t index = 0; index < reading->channels->size(); ++index) all->push_back(index);
  return DriverSamples({{std::move(reading), std::move(all)}});
}

}  // namespace halvox::platform::linux_::testing
