#pragma once

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

namespace halvox::platform::linux_ {

// How much may be on its way to a server without its acknowledgement.
struct AckWindow {
  std::size_t messages = 8192;
  std::size_t bytes = 16U << 20U;
};

// The messages that were published and not acknowledged yet, in the order in which they were
// published first. Each is either with the client library, known by its address there, or was given
// back and is held for another attempt. A window bounds them; what is held counts too.
//
// After a failure, beginAgain() goes back to the oldest; nextAgain() then tells one by one what to
// publish again, before anything new is added, so that the order stays.
// Belongs to whoever locks around it.
class PendingAcks {
 public:
  using Time = std::chrono::steady_clock::time_point;
  struct Entry {
    std::shared_ptr<AckLedger> ledger;  // none when nobody flushes
    AckLedger::Number number = 0;
    std::size_t bytes = 0;
    Time deadline;  // never before that of an older one
  };

  explicit PendingAcks(AckWindow window) : window_(window) {}

  // One message more may go, however large it is.
  [[nodiscard]] bool hasRoom() const { return size_ < window_.messages && bytes_ < window_.bytes; }
  // Half of the window is free, so that it is worth going on.
  [[nodiscard]] bool isHalfFree() const {
    return size_ <= window_.messages / 2 && bytes_ <= window_.bytes / 2;
  }
  [[nodiscard]] std::size_t size() const { return size_; }
  // When the oldest is given up; none when there is no message.
  [[nodiscard]] std::optional<Time> firstDeadline() const;

  // Only while nothing has to be published again.
  void add(const natsMsg* message, Entry entry);
  // What is known of a message that the library is done with, which is then gone; none when it was
  // given up before.
  std::optional<Entry> take(const natsMsg* message);
  // Holds a message that the library gave back for another attempt. False when it was given up.
  bool giveBack(NatsMessage message);

  void beginAgain() { again_ = first_; }
  // Older messages have to be published again before anything new.
  [[nodiscard]] bool needsAgain() const { return again_ < first_ + slots_.size(); }
  // The next of them is here: it is not when the library is just about to tell what became of it.
  [[nodiscard]] bool hasAgain() const { return needsAgain() && slots_[again_ - first_].held; }
  // The next of them, to be published at once; call it only when there is one.
  NatsMessage nextAgain();

  std::vector<Entry> takeOverdue(Time now);
  std::vector<Entry> takeAll() { return takeOverdue(Time::max()); }

 private:
  struct Slot {
    Entry entry;
    NatsMessage held{};
    bool isSettled = false;  // and stays until all older ones are settled
  };

  Entry settle(Slot& slot);
  void skipSettled();

  const AckWindow window_;
  std::deque<Slot> slots_;
  std::uint64_t first_ = 0;  // the number of the first slot; the others follow
  std::uint64_t again_ = 0;  // the number of the next to be published again; the end when none
  std::unordered_map<const natsMsg*, std::uint64_t> atLibrary_;
  std::size_t size_ = 0;   // of what is not settled
  std::size_t bytes_ = 0;  // of what is not settled
};

}  // namespace halvox::platform::linux_
