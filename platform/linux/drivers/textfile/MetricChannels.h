#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "platform/linux/drivers/DriverChannel.h"
#include "platform/linux/drivers/textfile/OpenMetricsText.h"

namespace halvox::platform::linux_ {

// A driver channel that a text file describes, and its values.
struct MetricChannel {
  ChannelDescription description;
  std::vector<std::uint64_t> values;
  std::size_t line = 0;  // where it begins
};

// The driver channels of a text file's metrics.
//
//   counter                 a simple channel that is a counter; a fraction is cut off
//   gauge                   a simple channel that is a gauge; a fraction is cut off
//   histogram               a histogram channel
//   stateset NAME, with     a state channel; the label NAME tells the state
//     NAME_residency and
//     NAME_transitions
//
// The labels driver, group, subgroup, channel and unit say what the channel is called; any other
// label is added to the channel's name. Metrics of other types are no channels.
class MetricChannels {
 public:
  // What contradicts itself is an error: then there is no channel at all.
  [[nodiscard]] static std::variant<std::vector<MetricChannel>, MetricError> from(
      std::string_view text);
};

}  // namespace halvox::platform::linux_
