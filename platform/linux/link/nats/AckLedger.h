#pragma once

#include <cstdint>
#include <functional>
#include <list>

#include "platform/linux/base/Mutex.h"

namespace halvox::platform::linux_ {

// The result of the messages that one flush waited for.
struct AckTally {
  std::uint64_t acknowledged = 0;
  std::uint64_t notAcknowledged = 0;
  friend bool operator==(const AckTally&, const AckTally&) = default;
};

enum class AckOutcome : std::uint8_t {
  kAcknowledged,
  kFailed,
  kRefused,  // the sender got an error instead; no flush counts it
};

// Accounts for the acknowledgements of one session, for which its flushes wait. A flush waits for
// the messages added since the previous flush, never for later ones, and reports the result of
// exactly these: a session that keeps sending must not delay its own flush. Threads: any; no
// function blocks. A `done` callback runs on the thread that resolves the last message, or that
// calls flush() or giveUp(), with no lock held. Owners: the session, and each of its messages until
// it is resolved.
class AckLedger {
 public:
  using Done = std::function<void(const AckTally&)>;
  using Number = std::uint64_t;
  using FlushId = std::uint64_t;

  // Counts a message as outstanding. The caller must resolve the returned number exactly once.
  [[nodiscard]] Number add() HALVOX_EXCLUDES(mutex_);
  void resolve(Number message, AckOutcome outcome) HALVOX_EXCLUDES(mutex_);

  // Calls `done` exactly once: when all messages are resolved, possibly before this returns, or
  // from giveUp(). Returns 0 when `done` has run already.
  FlushId flush(Done done) HALVOX_EXCLUDES(mutex_);
  // Ends a flush that still waits; its unresolved messages count as not acknowledged. Does nothing
  // for a flush that is done.
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
