#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>

#include "backends/HVReportingVocabulary.h"
#include "platform/value.h"
#include "session/Guarded.h"
#include "session/MessageHistory.h"
#include "session/ResourceAccount.h"
#include "session/VolumeHistory.h"

namespace halvox {

// The message history of a session's current run. It exists from begin() to end(); outside a run
// messages are not recorded.
//
// A history that takes much memory goes on outside memory. If that fails, for instance because the
// disk is full, it loses messages until there is room again. It tries again at most four times a
// second, and logs the first loss of a run.
//
// The volume messages of the run are made as messages are recorded; a stop takes them.
//
// Owned by the session. Any thread may call; the history has one lock, which also guards the
// counts of its identifiers and the volume messages.
class SessionHistory {
 public:
  // The history, locked. Holds none outside a run.
  using Lock = Guarded<std::optional<MessageHistory>>::Lock;

  // What became of a message. kNoRoom: the message was not kept, but counted and compared with the
  // next one like a recorded message.
  enum class Outcome : std::uint8_t { kRecorded, kRedundant, kNotStarted, kNoRoom };

  // Returns true if a session drops a message because it repeats `previous`, the message of the
  // same category and type before it; null if there is none. Pure: any thread may call.
  [[nodiscard]] static bool isRedundant(const platform::Dictionary* previous,
                                        AudioEventCategory category, AudioEventType type,
                                        const platform::Dictionary& message);

  // Charges the history to `held`, which must outlive this. Log lines name the reporter.
  SessionHistory(ReporterID reporterID, ResourceTally& held)
      : reporterID_(reporterID), held_(held) {}

  // Begins a run with an empty history.
  void begin();
  // Ends the run and returns its history. The caller destroys it, which for a long history takes
  // too long to do under the lock.
  [[nodiscard]] std::optional<MessageHistory> end();

  // Returns the history so far, and leaves an empty one until the end of the run; none outside a
  // run.
  [[nodiscard]] std::optional<MessageHistory> take();
  // Returns the volume messages of the messages so far, in order; null if there are none.
  [[nodiscard]] std::unique_ptr<const MessageHistory> takeVolumeMessages();

  [[nodiscard]] Lock lock() const { return history_.lock(); }
  // Number of recorded messages; 0 outside a run.
  [[nodiscard]] std::size_t size() const;

  // Records a message under its next identifier, unless it repeats the previous message of its
  // category and type.
  Outcome record(AudioEventCategory category, AudioEventType type,
                 const platform::Dictionary& message) {
    return recordLocked(lock(), category, type, message);
  }
  // Does the same for a caller that holds the lock.
  Outcome recordLocked(const Lock& history, AudioEventCategory category, AudioEventType type,
                       const platform::Dictionary& message);

 private:
  // memorySize(), makeRoom() and tryToMoveOut() are called with the history locked.
  [[nodiscard]] std::size_t memorySize(const MessageHistory& messages) const {
    return messages.memorySize() + volumes_->memorySize();
  }
  [[nodiscard]] bool makeRoom(MessageHistory& messages);
  [[nodiscard]] bool tryToMoveOut(MessageHistory& messages);
  [[nodiscard]] bool isClientOverItsShare() const;

  const ReporterID reporterID_;
  ResourceTally& held_;  // the session's
  Guarded<std::optional<MessageHistory>> history_;
  // The lock of history_ guards both.
  std::unique_ptr<VolumeHistory> volumes_;  // null outside a run
  // After a failed write, in the process's uptime.
  std::chrono::milliseconds nextTry_{0};
  std::chrono::milliseconds nextVolumeTry_{0};
};

}  // namespace halvox
