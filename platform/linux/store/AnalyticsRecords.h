#pragma once

#include <cstdint>
#include <memory>
#include <string_view>
#include <vector>

#include "platform/analytics.h"
#include "platform/linux/store/EventNames.h"
#include "platform/linux/store/PayloadEncoder.h"
#include "platform/linux/store/RecordCounters.h"
#include "platform/linux/store/RecordKind.h"
#include "platform/linux/store/RecordSpans.h"
#include "platform/linux/store/StoreLog.h"
#include "platform/linux/store/WriterQueue.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// The analytics events of the store. Every message makes two events with equal payloads. When two
// consecutive events of one batch have the same payload, they share a record: the payload is
// encoded and stored once. Events of one message that fall into two batches get a record each.
// Threads, owner and failures are those of RecordKind.
class AnalyticsRecords final : public RecordKind {
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
  [[nodiscard]] SqliteCode write(TransactionAllowance& allowance) override;
  void onCommitted(FinishedRecords& finished) override;
  std::uint64_t dropTaken(DropReason reason, FinishedRecords& finished) override;
  [[nodiscard]] SqliteCode oldestTime(std::optional<double>& time) override {
    return spans_.oldestTime(time);
  }
  [[nodiscard]] SqliteCode deleteOldest(bool& found) override { return spans_.deleteOldest(found); }
  [[nodiscard]] SqliteCode deleteOlderThan(double time, bool& found) override {
    return spans_.deleteOlderThan(time, found);
  }

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

  [[nodiscard]] SqliteCode writeNext(TransactionAllowance& allowance);
  [[nodiscard]] SqliteCode insert(const Event& event, const Event* twin, std::string_view payload);
  [[nodiscard]] SqliteCode identify(EventName& name);
  Dictionary build(std::size_t index);
  void endTransaction(FinishedRecords& finished);

  EventNames& names_;
  WriterQueue& queue_;
  RecordCounters counters_;
  const std::uint64_t longestPayload_;

  std::vector<Event> queued_;  // guarded by the lock of the WriterQueue

  // Used by the writer's thread only. Events before next_ are written, and their builders freed.
  std::vector<Event> taken_;
  std::size_t next_ = 0;
  PayloadEncoder encoder_;
  Dictionary lookedAhead_;  // the payload of the next event, built to compare it
  bool hasLookedAhead_ = false;
  Statements statements_;
  RecordSpans spans_{"analytics_records", "analytics_spans"};
  // Increases when the row numbers of names may be wrong: after a rollback, which may have removed
  // the rows, and after opening a database, which may be another one.
  std::uint64_t generation_ = 1;
  std::uint64_t written_ = 0;       // events in the open transaction, including tooLarge_
  std::uint64_t writtenBytes_ = 0;  // the length of their payloads
  std::uint64_t tooLarge_ = 0;      // events among written_ that were dropped for their length
  OncePerSecond tooLargeLines_;
};

}  // namespace halvox::platform::linux_
