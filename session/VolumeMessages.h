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

// Finds the volume messages of a history one at a time. The history need not stay locked between
// them. Messages that are added during the walk are ignored, because the session records each
// volume message in the same history.
//
// Belongs to one thread, which holds the lock of the history during each call of next(). The
// history must outlive it and stay where it is.
class VolumeWalk {
 public:
  // Walks the messages that the history has now; reports intervals longer than `minimumPlaytime`
  // seconds.
  VolumeWalk(double minimumPlaytime, const MessageHistory& history)
      : intervals_(minimumPlaytime), reader_(history), left_(history.size()) {}

  // The next volume message, or none at the end.
  platform::Message next();

 private:
  VolumeIntervals intervals_;
  MessageHistory::Reader reader_;
  std::size_t left_;  // messages to walk
};

// All volume messages of a history, in the order in which their intervals ended. Intervals of at
// most `minimumPlaytime` seconds are not reported.
[[nodiscard]] std::vector<platform::Dictionary> createVolumeMessages(const MessageHistory& history,
                                                                     double minimumPlaytime);

}  // namespace halvox
