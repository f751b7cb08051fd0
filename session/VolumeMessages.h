#pragma once

#include <cstddef>
#include <optional>
#include <vector>

#include "platform/value.h"
#include "session/MessageHistory.h"

namespace halvox {

// Measures how long a client played at which volume, from its messages in order.
//
//   closed --playing--> open --playing at the same volume--> open
//                       open --playing at another volume--> reported, open again
//                       open --not playing--> reported, closed
//
// Only messages with a volume count. An interval that is still open after the last message is never
// reported.
//
// The format, the devices and the process are reported as the client wrote them. Where a number is
// expected, any other value reads as 0:
// - A volume that is text counts as volume 0. It still opens and ends intervals: no time is
//   counted for a volume that was no longer set.
// - A playing state that is text means "not playing".
// - The service stamps the times itself. A message whose stamp is missing or not a number opens no
//   interval, and an interval that ends there is too short to be reported. The same holds for
//   stamps that run backwards.
//
// Belongs to one thread. Keeps the last values it saw, not the messages.
class VolumeIntervals {
 public:
  // Only intervals longer than `minimumPlaytime` seconds are reported.
  explicit VolumeIntervals(double minimumPlaytime) : minimumPlaytime_(minimumPlaytime) {}

  // Takes the next message of the run. Returns the volume message of the interval that this message
  // ends, if it ends one that is long enough.
  std::optional<platform::Dictionary> add(const platform::Dictionary& message);
  // False if the message has no key that matters here: add() would do nothing.
  [[nodiscard]] static bool isConcernedWith(const platform::Dictionary& message);
  // The bytes on the heap that the kept values take.
  [[nodiscard]] std::size_t memorySize() const;

 private:
  // The message of the interval that has just ended.
  [[nodiscard]] platform::Dictionary makeMessage(double seconds) const;

  const double minimumPlaytime_;
  platform::Value format_{"Unknown"};
  platform::Value devices_{"Unknown"};
  platform::Value process_{"Unknown"};
  platform::Value lastVolume_{-1};
  std::optional<double> start_;  // in seconds; none while no interval is open
};

// All volume messages of a history, in the order in which their intervals ended. Intervals of at
// most `minimumPlaytime` seconds are not reported.
[[nodiscard]] std::vector<platform::Dictionary> createVolumeMessages(const MessageHistory& history,
                                                                     double minimumPlaytime);

}  // namespace halvox
