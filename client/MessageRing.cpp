#include "client/MessageRing.h"

#include <algorithm>
#include <bit>
#include <utility>

namespace halvox::client {

std::size_t OutgoingMessage::weight() const {
  std::size_t bytes = sizeof(OutgoingMessage) + message.memorySize();
  if (const auto* list = std::get_if<std::vector<ReporterID>>(&recipients)) {
    bytes += list->size() * sizeof(ReporterID);
  }
  return bytes;
}

MessageRing::MessageRing(std::size_t maxItems, std::size_t maxBytes)
    : maxItems_(std::max<std::size_t>(maxItems, 1)),
      maxBytes_(maxBytes),
      mask_(std::bit_ceil(maxItems_) - 1),
      slots_(std::make_unique<Slot[]>(mask_ + 1)) {}

bool MessageRing::tryPush(OutgoingMessage&& message) {
  const std::size_t bytes = message.weight();
  if (items_.fetch_add(1, std::memory_order_acq_rel) >= maxItems_) {
    items_.fetch_sub(1, std::memory_order_acq_rel);
    return false;
  }
  if (bytes_.fetch_add(bytes, std::memory_order_relaxed) + bytes > maxBytes_) {
    bytes_.fetch_sub(bytes, std::memory_order_relaxed);
    items_.fetch_sub(1, std::memory_order_acq_rel);
    return false;
  }
  const std::uint64_t position = tail_.fetch_add(1, std::memory_order_seq_cst);
  Slot& free = slot(position);
  free.message = std::move(message);
  free.ready.store(position + 1, std::memory_order_seq_cst);
  return true;
}

bool MessageRing::isReady() const {
  return slot(head_).ready.load(std::memory_order_seq_cst) == head_ + 1;
}

void MessageRing::pop() {
  Slot& oldest = slot(head_);
  const std::size_t bytes = oldest.message.weight();
  oldest.message = {};
  ++head_;
  bytes_.fetch_sub(bytes, std::memory_order_relaxed);
  items_.fetch_sub(1, std::memory_order_acq_rel);
}

}  // namespace halvox::client
