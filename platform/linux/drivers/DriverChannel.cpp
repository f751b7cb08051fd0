#include "platform/linux/drivers/DriverChannel.h"

#include <utility>

namespace halvox::platform::linux_ {

std::size_t ChannelDescription::valueCount() const {
  constexpr std::size_t kNumbersOfState = 2;
  switch (format) {
    case IOReportFormat::kSimple:
      return 1;
    case IOReportFormat::kState:
      return kNumbersOfState * states.size();
    case IOReportFormat::kHistogram:
      return buckets.size();
    case IOReportFormat::kInvalid:
    case IOReportFormat::kSimpleArray:
      return 0;
  }
  return 0;
}

std::string ChannelDescription::fullName() const {
  std::string name = std::to_string(static_cast<int>(format));
  for (const auto* part : {&driverName, &group, &subGroup, &channelName}) {
    // The lengths keep the result unique, because a name may contain the separators.
    name += part->has_value() ? '\n' + std::to_string((*part)->size()) + ':' + **part : "\n-";
  }
  return name;
}

ChannelList::ChannelList(std::vector<Channel> channels) : channels_(std::move(channels)) {
  offsets_.reserve(channels_.size());
  for (const Channel& channel : channels_) {
    offsets_.push_back(static_cast<std::uint32_t>(valueCount_));
    valueCount_ += channel->valueCount();
  }
}

}  // namespace halvox::platform::linux_
