#include "platform/linux/link/nats/PendingAcks.h"

#include <algorithm>
#include <utility>

namespace halvox::platform::linux_ {

std::optional<PendingAcks::Time> PendingAcks::firstDeadline() const {
  if (slots_.empty()) return std::nullopt;
  return slots_.front().entry.deadline;
}

std::optional<PendingAcks::Time> PendingAcks::firstUnspooled() const {
  for (std::uint64_t number = std::max(unspooled_, first_); number < end(); ++number) {
    const Slot& slot = slots_[number - first_];
    if (!slot.isSettled) return slot.entry.published;
  }
  return std::nullopt;
}

void PendingAcks::add(natsMsg* message, Entry entry) {
  atLibrary_.insert_or_assign(message, end());
  ++size_;
  bytes_ += entry.bytes;
  const bool isSpooled = entry.spooled != 0;
  slots_.push_back({.entry = std::move(entry), .message = message});
  again_ = end();
  if (isSpooled) unspooled_ = end();
}

PendingAcks::Entry PendingAcks::settle(Slot& slot) {
  --size_;
  bytes_ -= slot.entry.bytes;
  slot.isSettled = true;
  slot.held.reset();
  return std::move(slot.entry);
}

// Restores two invariants: the first slot is unsettled, and the next slot to publish again is
// unsettled.
void PendingAcks::skipSettled() {
  while (!slots_.empty() && slots_.front().isSettled) {
    slots_.pop_front();
    ++first_;
  }
  again_ = std::max(again_, first_);
  while (needsAgain() && slots_[again_ - first_].isSettled) ++again_;
}

std::optional<PendingAcks::Entry> PendingAcks::take(const natsMsg* message) {
  const auto found = atLibrary_.find(message);
  if (found == atLibrary_.end()) return std::nullopt;
  const std::uint64_t number = found->second;
  atLibrary_.erase(found);
  // The message was abandoned as overdue while the library had it. Its slot no longer exists.
  if (number < first_) return std::nullopt;
  Entry entry = settle(slots_[number - first_]);
  skipSettled();
  return entry;
}

bool PendingAcks::giveBack(NatsMessage message) {
  const auto found = atLibrary_.find(message.get());
  if (found == atLibrary_.end()) return false;
  const std::uint64_t number = found->second;
  atLibrary_.erase(found);
  if (number < first_) return false;
  slots_[number - first_].held = std::move(message);
  return true;
}

NatsMessage PendingAcks::nextAgain() {
  NatsMessage message = std::move(slots_[again_ - first_].held);
  atLibrary_.insert_or_assign(message.get(), again_);
  ++again_;
  skipSettled();
  return message;
}

std::vector<PendingAcks::Entry> PendingAcks::takeOverdue(Time now) {
  std::vector<Entry> overdue;
  // Check only the oldest message, because a later message never has an earlier deadline.
  while (!slots_.empty() && slots_.front().entry.deadline <= now) {
    overdue.push_back(settle(slots_.front()));
    skipSettled();
  }
  return overdue;
}

}  // namespace halvox::platform::linux_
