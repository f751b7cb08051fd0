#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <variant>
#include <vector>

#include "client/HalvoxClient.h"

namespace halvox::client {

// Whom a message is for: all active sessions, one session, or several. One costs no allocation.
using Recipients = std::variant<std::monostate, ReporterID, std::vector<ReporterID>>;

// One message on its way to the service.
struct OutgoingMessage {
  Recipients recipients;
  Dictionary message;
  Category category = 0;
  EventType type = 0;

  // What it counts for against the bound in bytes.
  [[nodiscard]] std::size_t weight() const;
};

// The hand-off of messages from any number of threads to one, bounded in items and bytes.
//
// A ring of slots that are all there from the start. A producer first reserves room with one
// addition on each bound, which guarantees it a free slot, then takes the next position with a
// third: no loop, no lock and no allocation, so nothing that another thread does, or fails to do,
// can hold up an audio thread. (A lock taken with try_lock would need a second lane for the loser,
// and the order of one thread's messages would have to be put right again afterwards; a list needs
// an allocation per message.) A producer that is stopped between the two steps delays the consumer,
// never another producer.
//
// Near the bound, a producer whose own message is too large may for a moment make another's
// reservation fail as well; that one is dropped and counted like any other.
class MessageRing {
 public:
  MessageRing(std::size_t maxItems, std::size_t maxBytes);

  // Any thread. False when a bound is reached; the message is then untouched.
  bool tryPush(OutgoingMessage&& message);
  // How many messages were taken so far; the position that the next one gets.
  [[nodiscard]] std::uint64_t tail() const { return tail_.load(std::memory_order_seq_cst); }

  // The following belong to the consumer's thread.
  // The position of the oldest message that is still here.
  [[nodiscard]] std::uint64_t head() const { return head_; }
  // Whether the oldest message is complete. False too while its producer is still writing it.
  [[nodiscard]] bool isReady() const;
  // The oldest message; only when isReady().
  [[nodiscard]] const OutgoingMessage& front() const { return slot(head_).message; }
  void pop();

 private:
  struct Slot {
    // Position + 1 once the message is complete. Orders the message before its consumption, and,
    // being sequentially consistent, after a consumer's announcement that it goes to sleep.
    std::atomic<std::uint64_t> ready{0};
    OutgoingMessage message;
  };
  [[nodiscard]] Slot& slot(std::uint64_t position) const { return slots_[position & mask_]; }

  const std::size_t maxItems_;
  const std::size_t maxBytes_;
  const std::uint64_t mask_;
  const std::unique_ptr<Slot[]> slots_;
  // What is reserved. The consumer's subtraction orders the emptying of a slot before its reuse.
  std::atomic<std::size_t> items_{0};
  std::atomic<std::size_t> bytes_{0};
  // Hands the orders that producers saw in `items_` on to those with later positions.
  std::atomic<std::uint64_t> tail_{0};
  std::uint64_t head_ = 0;
};

}  // namespace halvox::client
