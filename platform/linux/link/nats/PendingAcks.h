#pragma once

#include <algorithm>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <memory>
#include <optional>
#include <unordered_map>
#include <vector>

#include "platform/linux/link/nats/AckLedger.h"
#include "platform/linux/link/nats/NatsHandles.h"
#include "platform/linux/store/spool/LinkSpool.h"

namespace halvox::platform::linux_ {

// How much may be published and not yet acknowledged. It bounds how much must be published again
// after a failure, and how much memory the client library needs in addition to our queue.
struct AckWindow {
  std::size_t messages = 8192;
  std::size_t bytes = 16U << 20U;
};

// The messages that were published and are not yet acknowledged, in the order of their first
// attempts. A message is either in the client library, which will report its outcome and identifies
// it by its address, or the library has returned it and it is held here for another attempt. Both
// count in the window.
//
// After a failure, beginAgain() goes back to the oldest message, and each nextAgain() returns one
// message to publish again. To keep the order, no new message may be added before needsAgain() is
// false.
// Not thread-safe; the owner must hold a lock.
class PendingAcks {
 public:
  using Time = std::chrono::steady_clock::time_point;
  struct Entry {
    std::shared_ptr<AckLedger> ledger{};  // null when no flush waits for it
    AckLedger::Number number = 0;
    std::size_t bytes = 0;
    Time published{};
    Time deadline{};                // never earlier than that of an older message
    LinkSpool::Number spooled = 0;  // its number in the spool; 0 if the spool does not have it
  };

  explicit PendingAcks(AckWindow window) : window_(window) {}

  // Returns true if one more message of any size may be published. If its size counted, a message
  // larger than the window could never be published.
  [[nodiscard]] bool hasRoom() const { return size_ < window_.messages && bytes_ < window_.bytes; }
  // Returns true if half of the window is free. The publisher waits for this after the window was
  // full, because waking it for each acknowledgement would cost more than publishing.
  [[nodiscard]] bool isHalfFree() const {
    return size_ <= window_.messages / 2 && bytes_ <= window_.bytes / 2;
  }
  [[nodiscard]] std::size_t size() const { return size_; }
  // Returns the deadline of the oldest message; std::nullopt if there is none.
  [[nodiscard]] std::optional<Time> firstDeadline() const;

  // Call only while needsAgain() is false. The library may own the message, but must not destroy it
  // before it is taken.
  void add(natsMsg* message, Entry entry);
  // Removes a message whose outcome the library has reported. Returns std::nullopt if it was
  // removed before as overdue.
  std::optional<Entry> take(const natsMsg* message);
  // Holds a message that the library has returned. Returns false if it was removed before as
  // overdue.
  bool giveBack(NatsMessage message);

  void beginAgain() { again_ = first_; }
  // Returns true if messages must be published again before any new message.
  [[nodiscard]] bool needsAgain() const { return again_ < first_ + slots_.size(); }
  // Returns true if the next message to publish again is held here. If it is not, the library has
  // it and will report its outcome.
  [[nodiscard]] bool hasAgain() const { return needsAgain() && slots_[again_ - first_].held; }
  // Removes and returns the next message to publish again. Publish it at once. Call only if
  // hasAgain().
  NatsMessage nextAgain();

  // Calls `spool` with each message that the spool does not have, oldest first. It must return the
  // message's number in the spool.
  template <typename Spool>
  void forEachUnspooled(Spool spool) {
    for (std::uint64_t number = std::max(unspooled_, first_); number < end(); ++number) {
      Slot& slot = slots_[number - first_];
      if (!slot.isSettled) slot.entry.spooled = spool(slot.message);
    }
    unspooled_ = end();
  }
  // Returns when the oldest message that the spool does not have was published; std::nullopt if
  // there is none.
  [[nodiscard]] std::optional<Time> firstUnspooled() const;

  // Removes and returns the messages whose deadline has passed, oldest first.
  std::vector<Entry> takeOverdue(Time now);
  std::vector<Entry> takeAll() { return takeOverdue(Time::max()); }

 private:
  struct Slot {
    Entry entry;
    natsMsg* message = nullptr;  // exists until the slot is settled
    NatsMessage held{};
    bool isSettled = false;  // a settled slot stays until all older ones are settled
  };

  [[nodiscard]] std::uint64_t end() const { return first_ + slots_.size(); }
  Entry settle(Slot& slot);
  void skipSettled();

  const AckWindow window_;
  std::deque<Slot> slots_;
  std::uint64_t first_ = 0;  // number of the first slot
  std::uint64_t again_ = 0;  // number of the next slot to publish again; one past the last if none
  // The first slot after all messages that the spool has. Later slots are of messages that it does
  // not have.
  std::uint64_t unspooled_ = 0;
  std::unordered_map<const natsMsg*, std::uint64_t> atLibrary_;
  std::size_t size_ = 0;   // of unsettled slots
  std::size_t bytes_ = 0;  // of unsettled slots
};

}  // namespace halvox::platform::linux_
