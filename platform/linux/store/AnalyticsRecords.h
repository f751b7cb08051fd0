#pragma once

#include <cstdint>
#include <memory>
#include <string_view>
#include <vector>

#include "platform/analytics.h"
#include "platform/linux/store/EventNames.h"
#include "platform/linux/store/SpannedRecordKind.h"
#include "platform/linux/store/WriterQueue.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// The analytics events of the store. Every message makes two events with equal payloads. When two
// consecutive events of one batch have the same payload, they share a record: the payload is
// encoded and stored once. Events of one message that fall into two batches get a record each.
// Threads, owner and failures are those of RecordKind.
class AnalyticsRecords final : public SpannedRecordKind {
 public:
  // Does not own its arguments, which must outlive it. `longestPayload` is in bytes.
  AnalyticsRecords(EventNames& names, WriterQueue& queue, StatisticsService& statistics,
                   std::uint64_t longestPayload);

  // Any thread. Queues an event with its time (seconds since 1970). Waits while the queue is full;
  // counts the event as dropped when the store is closed.
  void add(double time, std::string_view name, AnalyticsPayloadBuilder builder);

  [[nodiscard]] SqliteCode prepare(Database& database) override;
  void release() override;
  void takeQueued() override;
  [[nodiscard]] bool hasTaken() const override { return next_ < taken_.size(); }

 private:
  struct Event {
    double time;
    EventName* name;
    std::unique_ptr<EventName> ownName;  // owns the name if the table of names was full
    AnalyticsPayloadBuilder builder;
  };
  struct Statements {
    Statement insertRecord;
    Statement insertName;
    Statement findName;
  };

  [[nodiscard]] SqliteCode writeNext(TransactionAllowance& allowance) override;
  std::uint64_t forgetTaken() override;
  void logTooLarge(std::uint64_t longestPayload) const override;
  [[nodiscard]] SqliteCode insert(const Event& event, const Event* twin, std::string_view payload);
  [[nodiscard]] SqliteCode identify(EventName& name);
  Dictionary build(std::size_t index);

  EventNames& names_;

  std::vector<Event> queued_;  // guarded by the lock of the WriterQueue

  // Used by the writer's thread only. Events before next_ are written, and their builders freed.
  std::vector<Event> taken_;
  std::size_t next_ = 0;
  Dictionary lookedAhead_;  // the payload of the next event, built to compare it
  bool hasLookedAhead_ = false;
  Statements statements_;
  // Increases when the row numbers of names may be wrong: after a rollback, which may have removed
  // the rows, and after opening a database, which may be another one.
  std::uint64_t generation_ = 1;
};

}  // namespace halvox::platform::linux_
