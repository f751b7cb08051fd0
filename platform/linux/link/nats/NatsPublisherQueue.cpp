// The functions of the publisher that put messages into its queue and into the spool.

#include <utility>

#include "platform/linux/link/nats/NatsLog.h"
#include "platform/linux/link/nats/NatsPublisher.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog(natsLogCategory, "NatsLink");

}  // namespace

void NatsPublisher::resume(std::function<void()> stored) {
  const MutexLock lock(mutex_);
  queue_.resume(std::move(stored));
}

void NatsPublisher::setOnline(bool isOnline) {
  const MutexLock lock(mutex_);
  queue_.setOnline(isOnline);
}

std::optional<Error> NatsPublisher::take(OutgoingMessage& message) {
  OutgoingQueue::Kept kept;
  std::optional<Error> error;
  const Time now = spool_ == nullptr ? Time() : std::chrono::steady_clock::now();
  {
    const MutexLock lock(mutex_);
    if (hasEnded_) return refusedByLink("the service is ending");
    error = queue_.take(message, pending_, kept, now);
  }
  resolveKept(kept);
  return error;
}

// Call it without the lock. It may end a flush, whose callback may send.
void NatsPublisher::resolveKept(const OutgoingQueue::Kept& kept) {
  for (const auto& [ledger, number] : kept) ledger->resolve(number, AckOutcome::kKept);
}

void NatsPublisher::refuse(const OutgoingMessage& message) {
  statistics_.counter(kNatsPiece, "failed: refused").add();
  if (message.ledger) message.ledger->resolve(message.number, AckOutcome::kRefused);
}

void NatsPublisher::abandonAll() {
  returnPending("the connection ended");
  std::deque<OutgoingMessage> unsent;
  {
    const MutexLock lock(mutex_);
    hasEnded_ = true;
    unsent = queue_.takeAll();
  }
  // Call fail() without the lock. It may end a flush, whose callback may send.
  fail(unsent, "the service ended");
}

// Gives all unacknowledged messages, and with them the queued ones, back to the spool. Without a
// spool, abandons the unacknowledged ones.
void NatsPublisher::returnPending(std::string_view reason) {
  OutgoingQueue::Kept kept;
  std::vector<PendingAcks::Entry> lost;
  {
    const MutexLock lock(mutex_);
    queue_.keep(pending_, kept);
    for (PendingAcks::Entry& entry : pending_.takeAll()) {
      if (entry.spooled == 0) {
        lost.push_back(std::move(entry));
      } else if (entry.ledger) {
        kept.emplace_back(std::move(entry.ledger), entry.number);
      }
    }
    queue_.rewind();
  }
  resolveKept(kept);
  abandon(lost, reason);
}

void NatsPublisher::failQueued(std::string_view reason) {
  OutgoingQueue::Kept kept;
  std::deque<OutgoingMessage> unsent;
  {
    const MutexLock lock(mutex_);
    if (queue_.canKeep()) {
      queue_.keep(pending_, kept);
    } else {
      unsent = queue_.takeAll();
    }
  }
  resolveKept(kept);
  fail(unsent, reason);
}

bool NatsPublisher::hasUnsent() {
  const MutexLock lock(mutex_);
  return queue_.hasUnsent();
}

std::optional<NatsPublisher::Time> NatsPublisher::keepTime() {
  const MutexLock lock(mutex_);
  return queue_.keepTime(pending_);
}

void NatsPublisher::keep() {
  OutgoingQueue::Kept kept;
  {
    const MutexLock lock(mutex_);
    queue_.keep(pending_, kept);
  }
  resolveKept(kept);
}

bool NatsPublisher::mustRefill(Time now) {
  const MutexLock lock(mutex_);
  // Read nothing that could not be published soon. At the end of the service, the next run sends
  // what the spool holds.
  if (isEnding_ || flow_ != Flow::kFlowing || pending_.needsAgain() || !pending_.hasRoom()) {
    return false;
  }
  return queue_.mustRead(now);
}

std::optional<NatsPublisher::Time> NatsPublisher::refillTime() {
  const MutexLock lock(mutex_);
  return queue_.nextRead();
}

void NatsPublisher::refill() {
  OutgoingQueue::ReadPlan plan;
  {
    const MutexLock lock(mutex_);
    plan = queue_.planRead();
  }
  // Read and make messages without the lock, because senders would otherwise wait for the disk.
  const auto read = spool_->readAfter(plan.after);
  if (!read) {
    const Time now = std::chrono::steady_clock::now();
    if (readLog_.note(1, now)) kLog.error("", read.error().message, "; trying again");
    const MutexLock lock(mutex_);
    return queue_.noteFailedRead(now);
  }
  std::vector<OutgoingMessage> messages;
  messages.reserve(read->messages.size());
  for (const auto& [number, kept] : read->messages) {
    OutgoingMessage message;
    const natsStatus status =
        makeMessage(kept.subject.c_str(), kept.identifier, kept.body, message);
    message.spooled = number;
    if (status == NATS_OK) {
      messages.push_back(std::move(message));
    } else {
      std::deque<OutgoingMessage> failed;
      failed.push_back(std::move(message));
      fail(failed, natsStatus_GetText(status));
    }
  }
  const MutexLock lock(mutex_);
  queue_.addRead(plan, *read, std::move(messages));
}

}  // namespace halvox::platform::linux_
