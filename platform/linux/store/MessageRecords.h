#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "platform/analytics.h"
#include "platform/linux/store/EventNames.h"
#include "platform/linux/store/LinkParty.h"
#include "platform/linux/store/MessageBlocks.h"
#include "platform/linux/store/PayloadEncoder.h"
#include "platform/linux/store/RecordCounters.h"
#include "platform/linux/store/RecordKind.h"
#include "platform/linux/store/StoreLog.h"
#include "platform/linux/store/WriterQueue.h"
#include "platform/statistics.h"
#include "platform/value.h"

namespace halvox::platform::linux_ {

// A message of the real-time link, as the adapter of the local link queues it.
struct LinkMessageRecord {
  double time = 0;                         // seconds since 1970
  std::shared_ptr<const LinkParty> party;  // held by the session and by its waiting messages
  std::uint16_t category = 0;
  std::uint16_t type = 0;
  Dictionary payload{};
};

// The analytics events and the link messages of the store. One message of a client makes two events
// and, with the local link, a link message. These three records arrive through different ports but
// have nearly the same payload. All go into the same blocks, where compression removes what they
// share. The ports therefore need not say which records belong together.
// Threads, owner and failures are those of RecordKind.
class MessageRecords final : public RecordKind {
 public:
  // Does not own its arguments, which must outlive it. `longestPayload` is in bytes.
  MessageRecords(EventNames& names, WriterQueue& queue, StatisticsService& statistics,
                 std::uint64_t longestPayload);

  // Any thread. Queues an event with its time (seconds since 1970). Waits while the queue is full.
  // If the store is closed, counts the event as dropped.
  void addEvent(double time, std::string_view name, AnalyticsPayloadBuilder builder);
  // Does the same for a link message. Returns false if the store is closed.
  bool addLink(LinkMessageRecord record);

  [[nodiscard]] SqliteCode prepare(Database& database) override;
  void release() override { blocks_.release(); }
  void takeQueued() override;
  [[nodiscard]] bool hasTaken() const override { return next_ < taken_.size(); }
  [[nodiscard]] SqliteCode write(TransactionAllowance& allowance) override;
  void onCommitted(FinishedRecords& finished) override;
  std::uint64_t dropTaken(DropReason reason, FinishedRecords& finished) override;
  // Frees what only a busy store needs, when no taken record waits.
  void releaseMemory() {
    std::vector<Record>().swap(taken_);
    blocks_.releaseMemory();
  }
  [[nodiscard]] SqliteCode oldestTime(std::optional<double>& time) override {
    return blocks_.oldestTime(time);
  }
  [[nodiscard]] SqliteCode deleteOldest(bool& found) override {
    return blocks_.deleteOldest(found);
  }
  [[nodiscard]] SqliteCode deleteOlderThan(double time, bool& found) override {
    return blocks_.deleteOlderThan(time, found);
  }
  [[nodiscard]] SqliteCode erase(Database& database, ErasePass& pass, bool& more) override {
    return blocks_.erase(database, pass, more);
  }

 private:
  struct Event {
    double time;
    EventName* name;
    std::unique_ptr<EventName> ownName;  // owns the name if the table of names was full
    AnalyticsPayloadBuilder builder;
  };
  using Record = std::variant<Event, LinkMessageRecord>;
  // The records of one port in the open transaction.
  struct Port {
    Port(StatisticsService& statistics, std::string_view piece) : counters(statistics, piece) {}
    RecordCounters counters;
    std::uint64_t written = 0;   // including tooLarge
    std::uint64_t tooLarge = 0;  // dropped for the length of their payloads
  };

  [[nodiscard]] Port& portOf(const Record& record) {
    return std::holds_alternative<Event>(record) ? events_ : links_;
  }
  [[nodiscard]] SqliteCode writeNext(TransactionAllowance& allowance);
  void endTransaction(FinishedRecords& finished);

  EventNames& names_;
  WriterQueue& queue_;
  Port events_;
  Port links_;
  const std::uint64_t longestPayload_;

  std::vector<Record> queued_;  // guarded by the lock of the WriterQueue

  // Used by the writer's thread only. Records before next_ have been written and their content is
  // freed.
  std::vector<Record> taken_;
  std::size_t next_ = 0;
  PayloadEncoder encoder_;
  MessageBlocks blocks_;
  std::uint64_t writtenBytes_ = 0;  // the length of the payloads of the open transaction
  OncePerSecond tooLargeLines_;
};

// The part of MessageRecords that the local link may use: adding link messages. The store owns both
// objects.
class LinkMessageRecords {
 public:
  explicit LinkMessageRecords(MessageRecords& records) : records_(records) {}
  // Any thread. Waits while the queue is full, but never for the disk itself. If the store is
  // closed, drops and counts the message and returns false.
  bool add(LinkMessageRecord record) { return records_.addLink(std::move(record)); }

 private:
  MessageRecords& records_;
};

}  // namespace halvox::platform::linux_
