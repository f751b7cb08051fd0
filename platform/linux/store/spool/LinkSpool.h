#pragma once

#include <cstdint>
#include <functional>
#include <string>
#include <utility>
#include <vector>

#include "platform/linux/base/Result.h"
#include "platform/linux/store/StoreError.h"

namespace halvox::platform::linux_ {

// A message of the real-time link as a server gets it.
struct SpooledMessage {
  std::string subject;
  std::string identifier;  // by which the server recognises a second copy
  std::string body;
  friend bool operator==(const SpooledMessage&, const SpooledMessage&) = default;
};

// Keeps messages of the link that no server has acknowledged, over restarts of the service too.
// Messages have numbers, which only grow while the service runs. A number can be missing when its
// message is read: the message was dropped and counted, because the disk was full or because it was
// among the oldest of a full store.
//
// Threads: any, except for readAfter(), which is for one thread. Owner: the platform; outlives the
// link.
class LinkSpool {
 public:
  using Number = std::uint64_t;
  struct Read {
    // In order. Messages that removeThrough() has covered are not among them.
    std::vector<std::pair<Number, SpooledMessage>> messages;
    Number through = 0;  // where to go on reading; equal to `after` if nothing more is stored
  };

  LinkSpool() = default;
  LinkSpool(const LinkSpool&) = delete;
  LinkSpool& operator=(const LinkSpool&) = delete;
  virtual ~LinkSpool() = default;

  // Returns false while the store cannot be written, for example because the disk is full.
  [[nodiscard]] virtual bool canKeep() const = 0;
  // Keeps the message and returns its number; 0 if the store is closed. Waits while the store's
  // queue is full, but never for the disk itself.
  [[nodiscard]] virtual Number append(SpooledMessage message) = 0;
  // The highest number so far, including those of messages from earlier runs; 0 if there is none.
  [[nodiscard]] virtual Number lastAppended() const = 0;
  // Returns true while appended messages are neither stored nor dropped.
  [[nodiscard]] virtual bool hasUnstored() const = 0;

  // Reads some stored messages with higher numbers. Blocks on the disk.
  [[nodiscard]] virtual Result<Read, StoreError> readAfter(Number after) = 0;
  // Forgets all messages up to this number. Does not wait.
  virtual void removeThrough(Number number) = 0;
  // Calls `stored` whenever appended messages were stored or dropped, on the store's thread. It
  // must not block. Set it once, before the first append().
  virtual void onStored(std::function<void()> stored) = 0;
};

}  // namespace halvox::platform::linux_
