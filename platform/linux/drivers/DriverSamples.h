#pragma once

#include <memory>
#include <vector>

#include "platform/ioreport.h"
#include "platform/linux/drivers/DriverChannel.h"

namespace halvox::platform::linux_ {

// The selected channels of a reading, as positions in its list.
using ChannelSelection = std::vector<std::uint32_t>;

// The channels of one subscription at one moment, or their change between two moments. Immutable.
//
// Holds the readings of all sources, which it shares with the other subscriptions of that moment.
// The samples of eight groups therefore cost hardly more memory than one reading.
class DriverSamples final : public IOReportSamples {
 public:
  struct Part {
    std::shared_ptr<const Reading> reading;
    std::shared_ptr<const ChannelSelection> selection;
  };

  explicit DriverSamples(std::vector<Part> parts) : parts_(std::move(parts)) {}

  [[nodiscard]] const std::vector<Part>& parts() const { return parts_; }
  void iterate(const IOReportService::Visitor& visitor) const;

 private:
  const std::vector<Part> parts_;
};

// The change from `previous` to `current`, of the channels that are in both. A channel that is only
// in one of them is skipped, because its start or end value is unknown. This also concerns the
// channels of a source that was late for one of them. A state channel is also skipped if none of
// its states held for any time in between, because such a channel has nothing to report. The
// differences are those that IOReportCreateSamplesDelta promises.
[[nodiscard]] std::shared_ptr<const DriverSamples> makeDelta(const DriverSamples& previous,
                                                             const DriverSamples& current);

}  // namespace halvox::platform::linux_
