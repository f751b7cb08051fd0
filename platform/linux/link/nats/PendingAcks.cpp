#include "platform/linux/link/nats/PendingAcks.h"

#include <utility>

namespace halvox::platform::linux_ {

void PendingAcks::add(const void* message, Entry entry) {
  entry.epoch = epoch_;
  ++messages_;
  bytes_ += entry.bytes;
  entries_.insert_or_assign(message, std::move(entry));
}

std::optional<PendingAcks::Entry> PendingAcks::take(const void* message) {
  const auto found = entries_.find(message);
  if (found == entries_.end()) return std::nullopt;
  Entry entry = std::move(found->second);
  entries_.erase(found);
  if (entry.epoch == epoch_) {
    --messages_;
    bytes_ -= entry.bytes;
  }
  return entry;
}

std::vector<PendingAcks::Entry> PendingAcks::takeAll() {
  std::vector<Entry> all;
  all.reserve(entries_.size());
  for (auto& [message, entry] : entries_) all.push_back(std::move(entry));
  entries_.clear();
  beginEpoch();
  return all;
}

void PendingAcks::beginEpoch() {
  ++epoch_;
  messages_ = 0;
  bytes_ = 0;
}

}  // namespace halvox::platform::linux_
