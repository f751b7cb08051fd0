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
    std::size_t source = 0;  // the number of the one that was read
  };
  using Sources = std::vector<std::size_t>;

  // `late` are the sources whose readings did not come in time.
  explicit DriverSamples(std::vector<Part> parts, Sources late = {})
      : parts_(std::move(parts)), late_(std::move(late)) {}

  [[nodiscard]] const std::vector<Part>& parts() const { return parts_; }
  [[nodiscard]] bool wasLate(std::size_t source) const;
  void iterate(const IOReportService::Visitor& visitor) const;

 private:
  const std::vector<Part> parts_;
  const Sources late_;
};

// What changed from one to the other, channel by channel of the current ones. Counts, hits,
// transitions and residencies are differences; minimum and maximum are the current ones. A channel
// that is new, or that has a number lower than before, counts from zero as a whole; one that is
// gone is left out, and so are all of a source that was late before: what they counted by then is
// not known.
[[nodiscard]] std::shared_ptr<const DriverSamples> makeDelta(const DriverSamples& previous,
                                                             const DriverSamples& current);

}  // namespace halvox::platform::linux_
