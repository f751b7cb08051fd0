#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <unordered_map>
#include <vector>

#include "platform/linux/link/nats/AckLedger.h"

namespace halvox::platform::linux_ {

// How much may be on its way to a server without its acknowledgement.
struct AckWindow {
  std::size_t messages = 8192;
  std::size_t bytes = 16U << 20U;
};

// The messages that were given to the client library and not acknowledged yet, by the address of
// the library's message. A window bounds them. What was on its way when the connection broke may
// never be acknowledged: beginEpoch() takes it out of the window, so that it does not hold the next
// messages up until its time is over.
// Belongs to whoever locks around it.
class PendingAcks {
 public:
  struct Entry {
    std::shared_ptr<AckLedger> ledger;  // none when nobody flushes
    AckLedger::Number number = 0;
    std::size_t bytes = 0;
    std::uint64_t epoch = 0;
  };

  explicit PendingAcks(AckWindow window) : window_(window) {}

  // One message more may go, however large it is.
  [[nodiscard]] bool hasRoom() const {
    return messages_ < window_.messages && bytes_ < window_.bytes;
  }
  // Half of the window is free, so that it is worth going on.
  [[nodiscard]] bool isHalfFree() const {
    return messages_ <= window_.messages / 2 && bytes_ <= window_.bytes / 2;
  }
  [[nodiscard]] std::size_t size() const { return entries_.size(); }

  void add(const void* message, Entry entry);
  // The entry, which is then gone; none when it was taken before.
  std::optional<Entry> take(const void* message);
  std::vector<Entry> takeAll();
  void beginEpoch();

 private:
  const AckWindow window_;
  std::unordered_map<const void*, Entry> entries_;
  std::uint64_t epoch_ = 0;
  std::size_t messages_ = 0;  // of this epoch
  std::size_t bytes_ = 0;     // of this epoch
};

}  // namespace halvox::platform::linux_
