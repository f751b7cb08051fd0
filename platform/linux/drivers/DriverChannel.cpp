#include "platform/linux/drivers/DriverChannel.h"

#include <utility>

namespace halvox::platform::linux_ {

std::size_t ChannelDescription::valueCount() const {
  constexpr std::size_t kNumbersOfState = 2;
  constexpr std::size_t kMinimumAndMaximum = 2;
  switch (format) {
    case IOReportFormat::kSimple:
      return 1;
    case IOReportFormat::kState:
      return kNumbersOfState * states.size();
    case IOReportFormat::kHistogram:
      return buckets.size() + kMinimumAndMaximum;
    case IOReportFormat::kInvalid:
    case IOReportFormat::kSimpleArray:
      return 0;
  }
  return 0;
}

ChannelList::ChannelList(std::vector<Channel> channels) : channels_(std::move(channels)) {
  offsets_.reserve(channels_.size());
  for (const Channel& channel : channels_) {
    offsets_.push_back(static_cast<std::uint32_t>(valueCount_));
    valueCount_ += channel->valueCount();
  }
}

}  // namespace halvox::platform::linux_
