#pragma once

#include <cstdint>
#include <functional>
#include <list>

#include "platform/linux/base/Mutex.h"

namespace halvox::platform::linux_ {

// What became of the messages that one flush waited for.
struct AckTally {
  std::uint64_t acknowledged = 0;
  std::uint64_t notAcknowledged = 0;
  friend bool operator==(const AckTally&, const AckTally&) = default;
};

enum class AckOutcome : std::uint8_t {
  kAcknowledged,
  kFailed,
  kRefused,  // its sender was told: no flush counts it
};

// The bookkeeping of one session: which of its messages a server has confirmed, and who waits for
// that. A flush waits for the messages that were added before it and since the flush before, never
// for later ones, and tells what became of exactly these.
// Any thread; shared by the session and by its messages on their way. Never blocks.
class AckLedger {
 public:
  using Done = std::function<void(const AckTally&)>;
  using Number = std::uint64_t;
  using FlushId = std::uint64_t;

  // Begins the account of a message, which must be resolved once.
  [[nodiscard]] Number add() HALVOX_EXCLUDES(mutex_);
  void resolve(Number message, AckOutcome outcome) HALVOX_EXCLUDES(mutex_);

  // Calls `done` exactly once: when all are resolved, which may be before this returns, or when the
  // flush is given up.
  FlushId flush(Done done) HALVOX_EXCLUDES(mutex_);
  // Ends the wait of a flush, if it still waits: what is unresolved counts as not acknowledged.
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
  std::list<Account> flushes_ HALVOX_GUARDED_BY(mutex_);  // that wait, the oldest first
};

}  // namespace halvox::platform::linux_
