#pragma once

#include <functional>
#include <string>

#include "platform/value.h"
#include "session/MessageHistory.h"
#include "session/SessionHistory.h"

namespace halvox {

class SessionProfile;

// What a session reports about its run when it stops: how long was played at which volume, every
// value that every key had, and on internal builds a file with the whole history.
//
// Owned by the session, on the thread that stops it. Takes time in proportion to the history; each
// operation locks the history only while it reads it.
class SessionSummary {
 public:
  using Send = std::function<void(const platform::Message&)>;

  // Both must outlive this.
  SessionSummary(const SessionProfile& profile, const SessionHistory& history)
      : profile_(profile), history_(history) {}

  // Passes each volume message to `send` as soon as it is found. The messages of a long history are
  // many and are not collected first; `send` may add to the history.
  void sendVolumeMessages(const Send& send) const;
  // The summary event; none if the history is empty or the session is not started.
  [[nodiscard]] platform::Message createEvent() const;
  // On internal builds, writes the history into a JSON file, unless it is empty. Logs failures.
  // Waits for the disk.
  void writeFile() const;

 private:
  void logIfCutShort(const MessageHistory::Reader& reader) const;
  [[nodiscard]] std::string fileName() const;

  const SessionProfile& profile_;  // the session's
  const SessionHistory& history_;  // the session's
};

}  // namespace halvox
