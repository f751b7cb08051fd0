#include "platform/linux/link/nats/AckLedger.h"

#include <algorithm>
#include <utility>

namespace halvox::platform::linux_ {

AckLedger::Number AckLedger::add() {
  const MutexLock lock(mutex_);
  ++current_.outstanding;
  return ++current_.last;
}

void AckLedger::note(Account& account, AckOutcome outcome) {
  --account.outstanding;
  switch (outcome) {
    case AckOutcome::kAcknowledged:
      ++account.tally.acknowledged;
      return;
    case AckOutcome::kFailed:
      ++account.tally.notAcknowledged;
      return;
    case AckOutcome::kKept:
      ++account.tally.kept;
      return;
    case AckOutcome::kRefused:
      return;
  }
}

void AckLedger::resolve(Number message, AckOutcome outcome) {
  Account ended;
  {
    const MutexLock lock(mutex_);
    // In most cases no flush has been called since the message was added.
    if (message >= current_.first) return note(current_, outcome);
    const auto flush = std::ranges::find_if(flushes_, [message](const Account& account) {
      return message >= account.first && message <= account.last;
    });
    if (flush == flushes_.end()) return;  // the flush of this message was given up
    note(*flush, outcome);
    if (flush->outstanding > 0) return;
    ended = std::move(*flush);
    flushes_.erase(flush);
  }
  ended.done(ended.tally);
}

AckLedger::FlushId AckLedger::flush(Done done) {
  Account account;
  {
    const MutexLock lock(mutex_);
    // Messages that are added later belong to the next flush. This flush must end even if messages
    // keep coming.
    account = std::exchange(current_, Account{});
    current_.first = account.last + 1;
    current_.last = account.last;
    account.done = std::move(done);
    if (account.outstanding > 0) {
      flushes_.push_back(std::move(account));
      return flushes_.back().last;
    }
  }
  account.done(account.tally);
  return 0;
}

void AckLedger::giveUp(FlushId id) {
  Account ended;
  {
    const MutexLock lock(mutex_);
    const auto flush = std::ranges::find(flushes_, id, &Account::last);
    if (id == 0 || flush == flushes_.end()) return;
    ended = std::move(*flush);
    flushes_.erase(flush);
  }
  ended.tally.notAcknowledged += ended.outstanding;
  // Call `done` without the lock, because it may send or flush again.
  ended.done(ended.tally);
}

}  // namespace halvox::platform::linux_
