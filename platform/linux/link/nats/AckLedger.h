#pragma once

#include <cstdint>
#include <functional>
#include <list>

#include "platform/linux/base/Mutex.h"

namespace halvox::platform::linux_ {

// What became of the messages for which one flush waited.
struct AckTally {
  std::uint64_t acknowledged = 0;
  std::uint64_t notAcknowledged = 0;
  std::uint64_t kept = 0;  // in the store, for later
  friend bool operator==(const AckTally&, const AckTally&) = default;
};

enum class AckOutcome : std::uint8_t {
  kAcknowledged,
  kFailed,
  kKept,     // a server gets it later, perhaps after a restart of the service
  kRefused,  // the sender got an error instead; no flush counts it
};

// Counts the acknowledgements of one session for the session's flushes. A flush waits for the
// messages that were added since the previous flush, and reports the result of exactly these. It
// never waits for later messages, because a session that keeps sending must not delay its own
// flush. Threads: any; no function blocks. A `done` callback runs on the thread that resolves the
// last message, or that calls flush() or giveUp(), with no lock held. Owners: the session, and each
// of its messages until the message is resolved.
class AckLedger {
 public:
  using Done = std::function<void(const AckTally&)>;
  using Number = std::uint64_t;
  using FlushId = std::uint64_t;

  // Counts a message as outstanding. The caller must resolve the returned number exactly once.
  [[nodiscard]] Number add() HALVOX_EXCLUDES(mutex_);
  void resolve(Number message, AckOutcome outcome) HALVOX_EXCLUDES(mutex_);

  // Calls `done` exactly once: when all messages are resolved, which may be before flush() returns,
  // or from giveUp(). Returns 0 if `done` has run already.
  FlushId flush(Done done) HALVOX_EXCLUDES(mutex_);
  // Ends a flush that still waits. Its unresolved messages count as not acknowledged. Does nothing
  // if the flush has ended.
  void giveUp(FlushId id) HALVOX_EXCLUDES(mutex_);

 private:
  struct Account {
    Number first = 1;
    Number last = 0;
    AckTally tally{};
    std::uint64_t outstanding = 0;
    Done done{};
  };

  static void note(Account& account, AckOutcome outcome);

  Mutex mutex_;
  Account current_ HALVOX_GUARDED_BY(mutex_);
  std::list<Account> flushes_ HALVOX_GUARDED_BY(mutex_);  // waiting, oldest first
};

}  // namespace halvox::platform::linux_
