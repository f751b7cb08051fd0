#pragma once

#include <optional>

#include "platform/value.h"

namespace halvox {

// Finds in a run of messages how long the client played at which volume.
//
// An interval opens at a message that carries a volume and says that the client plays, goes on over
// playing messages with the same volume, and ends at the next message with a volume that is another
// or that says that nothing plays. What is still open at the end is never reported.
//
// What clients write is taken as it stands where any value serves (format, devices, process). Where
// a number is wanted, everything else reads as 0, as it does all over the service: a volume given
// as text counts as volume 0, which still opens and ends intervals, so no time is counted for a
// volume that was no longer set; a playing state given as text says that nothing plays. The stamps
// are the service's own: one that is missing or no number opens no interval and, at the end of one,
// makes it too short to be reported. Stamps that go backwards make it too short as well.
//
// Belongs to one thread. Holds the values that it saw last, not the messages.
class VolumeIntervals {
 public:
  // Only intervals longer than that many seconds are reported.
  explicit VolumeIntervals(double minimumPlaytime) : minimumPlaytime_(minimumPlaytime) {}

  // Takes the next message of the run. Returns the volume message of the interval that it ends, if
  // it ends one that is long enough.
  std::optional<platform::Dictionary> add(const platform::Dictionary& message);

 private:
  [[nodiscard]] platform::Dictionary makeMessage(double seconds) const;

  const double minimumPlaytime_;
  platform::Value format_{"Unknown"};
  platform::Value devices_{"Unknown"};
  platform::Value process_{"Unknown"};
  platform::Value lastVolume_{-1};
  std::optional<double> start_;  // none while no interval is open
};

}  // namespace halvox
