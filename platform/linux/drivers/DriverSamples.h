#pragma once

#include <memory>
#include <vector>

#include "platform/ioreport.h"
#include "platform/linux/drivers/DriverChannel.h"

namespace halvox::platform::linux_ {

// Which of a reading's channels are meant, by their positions in its list.
using ChannelSelection = std::vector<std::uint32_t>;

// The channels of one subscription at one moment, or their change between two. Holds the readings
// of all sources whole and shares them with the other subscriptions that were sampled at that
// moment, so samples cost next to nothing of their own. Immutable.
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

// What changed from one to the other, of the channels that are in both: what a channel counted
// before it was first sampled is not known, nor is what a source counted that was late. The
// differences are those that IOReportCreateSamplesDelta promises.
[[nodiscard]] std::shared_ptr<const DriverSamples> makeDelta(const DriverSamples& previous,
                                                             const DriverSamples& current);

}  // namespace halvox::platform::linux_
