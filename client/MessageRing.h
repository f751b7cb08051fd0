#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <variant>
#include <vector>

#include "client/HalvoxClient.h"

namespace halvox::client {

// The sessions that a message is for: all active ones, one, or several. One needs no allocation.
using Recipients = std::variant<std::monostate, ReporterID, std::vector<ReporterID>>;

// One message on its way to the service.
struct OutgoingMessage {
  Recipients recipients;
  Dictionary message;
  Category category = 0;
  EventType type = 0;

  // Its size for the bound in bytes.
  [[nodiscard]] std::size_t weight() const;
};

// Passes messages from any number of threads to one, bounded in items and bytes.
//
// A ring of slots, all allocated at construction. A producer reserves room with one atomic addition
// for each bound, which guarantees it a free slot. A third addition gives it the next position.
// There is no loop, lock or allocation, so that no other thread can delay an audio thread. A
// producer that is interrupted between the two steps delays the consumer, but no other producer.
//
// Rejected: try_lock() needs a second lane for the thread that does not get the lock, and the order
// of that thread's messages must be restored afterwards. A list needs an allocation for each
// message.
//
// Near a bound, a producer whose message is too large can make the reservation of another producer
// fail for a moment. That message is dropped and counted like any other.
class MessageRing {
 public:
  MessageRing(std::size_t maxItems, std::size_t maxBytes);

  // Any thread may call. Returns false, and leaves the message as it is, if a bound is reached.
  bool tryPush(OutgoingMessage&& message);
  // The number of messages accepted so far, which is the position of the next one.
  [[nodiscard]] std::uint64_t tail() const { return tail_.load(std::memory_order_seq_cst); }

  // Only the consumer's thread may call the following functions.
  // The position of the oldest message in the ring.
  [[nodiscard]] std::uint64_t head() const { return head_; }
  // True if there is a message and its producer has finished writing it.
  [[nodiscard]] bool isReady() const;
  // The oldest message. Call only if isReady().
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
  // The reserved room. The consumer's subtraction orders the emptying of a slot before its reuse.
  std::atomic<std::size_t> items_{0};
  std::atomic<std::size_t> bytes_{0};
  // Passes the ordering that producers saw in `items_` on to producers with later positions.
  std::atomic<std::uint64_t> tail_{0};
  std::uint64_t head_ = 0;
};

}  // namespace halvox::client
