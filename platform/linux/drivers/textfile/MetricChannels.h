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
  std::size_t line = 0;  // where the file begins to describe it
};

// Makes driver channels from the metrics of a text file.
//
//   counter                 a simple channel that is a counter; a fraction is rounded down
//   gauge                   a simple channel that is a gauge; a fraction is rounded down
//   histogram               a histogram channel
//   stateset NAME, with     a state channel; the label NAME names the state
//     NAME_residency and
//     NAME_transitions
//
// The labels driver, group, subgroup, channel and unit name the channel. Any other label is
// appended to the channel's name. Metrics of other types are ignored. Pure functions; any thread
// may call them.
class MetricChannels {
 public:
  // The channels, or the first error. A text with a contradiction gives no channel at all, because
  // a part of a file would otherwise be reported as if it were complete.
  [[nodiscard]] static std::variant<std::vector<MetricChannel>, MetricError> from(
      std::string_view text);
};

}  // namespace halvox::platform::linux_
