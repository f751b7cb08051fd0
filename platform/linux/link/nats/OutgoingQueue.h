#pragma once

#include <atomic>
#include <chrono>
#include <cstddef>
#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <optional>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "platform/linux/link/nats/OutgoingMessage.h"
#include "platform/linux/link/nats/PendingAcks.h"
#include "platform/linux/store/spool/LinkSpool.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// The messages that wait to be published, in order. While servers take messages, they wait in
// memory only. What would wait longer goes into the spool, if there is one, and comes back from
// there in order. It survives the end of the process, and does not fill the memory.
//
//   memory --keep()--> spool --nothing more to read--> catching up --all read--> memory
//                        ^                                  |
//                        +--------------keep()--------------+
//
//   memory: messages wait in memory and leave in order.
//   spool: new messages are appended to the spool; those to be published next are read from it.
//   catching up: new messages wait in memory, and leave when the store has written the last
//                messages of the spool and they have been read. Otherwise a steady sender would
//                send through the store for ever.
//
// A message in the spool has a number there. It is in flight from the time when it is read, or when
// a copy of a published message is appended, until it is acknowledged. The spool forgets messages
// up to the first one in flight.
//
// Not thread-safe; the owner must hold a lock.
class OutgoingQueue {
 public:
  using Time = std::chrono::steady_clock::time_point;
  // Messages whose flush must not wait any longer, because they were kept. The caller resolves
  // them, without its lock.
  using Kept = std::vector<std::pair<std::shared_ptr<AckLedger>, AckLedger::Number>>;

  // The bytes that may wait in memory. This is the size of the largest request of a client, and of
  // about 37,000 ordinary messages (886 bytes with headers). With a larger queue, a session would
  // get the error of a broken link later.
  static constexpr std::size_t kQueueBytes = 32U << 20U;
  // A message that has waited for this long, or whose acknowledgement has, goes into the spool. A
  // kill must not lose what was answered half a second before, and storing takes up to 100 ms. Most
  // connections are made, and most leaders elected, in less time, and then nothing is stored.
  static constexpr std::chrono::milliseconds kMemoryTime{300};
  // The pause after a failed read.
  static constexpr std::chrono::seconds kReadPause{1};
  // The spool forgets so many messages at once, because each time is a transaction.
  static constexpr LinkSpool::Number kForgottenAtOnce = 1024;

  // The owner reads from the spool without its lock, because reading waits for the disk.
  struct ReadPlan {
    LinkSpool::Number after = 0;
    std::uint64_t stored = 0;
    bool hasUnstored = false;
  };

  // `spool` may be null. Does not own its arguments, which must outlive it.
  OutgoingQueue(LinkSpool* spool, StatisticsService& statistics);

  // Returns true if messages would be kept while no server is there.
  [[nodiscard]] bool canKeep() const { return spool_ != nullptr && spool_->canKeep(); }
  // Goes on with the messages that an earlier run has kept. Calls `stored`, on the store's thread,
  // when messages for which the queue waits were stored. `stored` must not block.
  void resume(std::function<void()> stored);
  // Whether a server is connected.
  void setOnline(bool isOnline) { isOnline_ = isOnline; }

  // Queues the message and moves from it. If there is no room, returns the error and leaves
  // `message` unchanged. `pending` are the published messages, which precede it in the spool.
  [[nodiscard]] std::optional<Error> take(OutgoingMessage& message, PendingAcks& pending,
                                          Kept& kept, Time now);
  // Moves all messages from memory into the spool, and copies of the published ones.
  void keep(PendingAcks& pending, Kept& kept);
  // Returns when keep() is due; std::nullopt if nothing must be kept.
  [[nodiscard]] std::optional<Time> keepTime(const PendingAcks& pending) const;

  // Returns true if a message can be published now.
  [[nodiscard]] bool hasNext() const { return !read_.empty() || hasNextInMemory(); }
  // Returns true if any message waits here or in the spool.
  [[nodiscard]] bool hasUnsent() const;
  // Removes and returns the next message. Call only if hasNext().
  [[nodiscard]] OutgoingMessage takeNext();
  // Removes and returns all messages that are in memory only.
  [[nodiscard]] std::deque<OutgoingMessage> takeAll();

  // Returns true if messages must be read from the spool.
  [[nodiscard]] bool mustRead(Time now) const;
  // Returns when the next read after a failed one is due; std::nullopt if none failed.
  [[nodiscard]] std::optional<Time> nextRead() const { return nextRead_; }
  [[nodiscard]] ReadPlan planRead() const;
  // Queues what was read. `messages` are those of `read` that could be made.
  void addRead(const ReadPlan& plan, const LinkSpool::Read& read,
               std::vector<OutgoingMessage> messages);
  void noteFailedRead(Time now) { nextRead_ = now + kReadPause; }

  // A message of the spool was acknowledged, or cannot be delivered.
  void settle(LinkSpool::Number number);
  // All messages of the spool that are in flight will be read again. Call keep() before.
  void rewind();

 private:
  enum class Mode : std::uint8_t { kMemory, kSpool, kCatchingUp };

  [[nodiscard]] LinkSpool::Number append(natsMsg* message);
  [[nodiscard]] std::optional<Error> takeIntoSpool(OutgoingMessage& message, Kept& kept);
  [[nodiscard]] bool hasNextInMemory() const { return mode_ == Mode::kMemory && !memory_.empty(); }
  // The number up to which no message is in flight or unread.
  [[nodiscard]] LinkSpool::Number settledThrough() const;
  void forgetSettled();

  LinkSpool* const spool_;
  Counter& kept_;
  Counter& readFromSpool_;
  Mode mode_ = Mode::kMemory;
  bool isOnline_ = false;
  std::deque<OutgoingMessage> memory_;
  std::size_t memoryBytes_ = 0;
  std::deque<OutgoingMessage> read_;  // from the spool
  std::set<LinkSpool::Number> inFlight_;
  LinkSpool::Number readThrough_ = 0;
  LinkSpool::Number forgottenThrough_ = 0;
  std::optional<Time> nextRead_;
  // How often the store has stored messages, and the count after which a read makes sense.
  std::atomic<std::uint64_t> stored_{0};
  std::optional<std::uint64_t> readAfterStored_;
  std::atomic<bool> awaitsStored_{false};
};

}  // namespace halvox::platform::linux_
