#pragma once

#include <memory>
#include <string>
#include <utility>

#include "platform/linux/drivers/DriverChannel.h"

namespace halvox::platform::linux_ {

// The groups of the channels of sinks and of sources, and the subgroup that both have.
inline constexpr const char* kSinkGroup = "Speaker";
inline constexpr const char* kSourceGroup = "Rx";
inline constexpr const char* kPipeWireSubGroup = "PipeWire";
// The group of what the clock of a sink or source is set to. No session reports this group: these
// values are settings and not counts.
inline constexpr const char* kClockGroup = "Clock";

// Describes a counter of this source. The caller changes the format for other channels.
inline ChannelDescription describeNodeChannel(std::string group, std::string driver,
                                              std::string name) {
  ChannelDescription channel;
  channel.kind = IOReportKind::kCounter;
  channel.group = std::move(group);
  channel.subGroup = kPipeWireSubGroup;
  channel.driverName = std::move(driver);
  channel.channelName = std::move(name);
  return channel;
}

inline ChannelList::Channel makeChannel(ChannelDescription description) {
  return std::make_shared<const ChannelDescription>(std::move(description));
}

}  // namespace halvox::platform::linux_
