#pragma once

#include <cstdint>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/linux/store/PayloadEncoder.h"
#include "platform/linux/store/RecordCounters.h"
#include "platform/linux/store/RecordKind.h"
#include "platform/linux/store/RecordSpans.h"
#include "platform/linux/store/RecordTables.h"
#include "platform/linux/store/StoreLog.h"
#include "platform/linux/store/WriterQueue.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// What all kinds of records that are written as they come have in common: all but the records
// themselves. Any thread may add; the rest is called by the writer.
class SimpleRecordKind : public RecordKind {
 public:
  [[nodiscard]] SqliteCode prepare(Database& database) final;
  void release() final;
  void takeQueued() final;
  [[nodiscard]] bool hasTaken() const final { return next_ < taken_; }
  [[nodiscard]] SqliteCode write(TransactionAllowance& allowance) final;
  void onCommitted(FinishedRecords& finished) final;
  std::uint64_t dropTaken(DropReason reason, FinishedRecords& finished) final;
  [[nodiscard]] SqliteCode oldestTime(std::optional<double>& time) final {
    return spans_.oldestTime(time);
  }
  [[nodiscard]] SqliteCode deleteOldest(bool& found) final { return spans_.deleteOldest(found); }
  [[nodiscard]] SqliteCode deleteOlderThan(double time, bool& found) final {
    return spans_.deleteOlderThan(time, found);
  }

 protected:
  // The first column's place among the values of the statement that inserts a record.
  static constexpr int kFirstColumn = 3;

  // What the statement that inserts a record was given.
  struct Bound {
    double time;
    std::size_t bytes;  // of the payload
  };

  // Does not own its arguments, which must outlive it; the table is a constant. `longestPayload`
  // in bytes.
  SimpleRecordKind(const RecordTable& table, WriterQueue& queue, StatisticsService& statistics,
                   std::uint64_t longestPayload);

  // Runs `append`, which queues one record, once there is room; false when the store is closed.
  template <typename Append>
  bool addQueued(Append&& append) {
    counters_.addReceived();
    const bool added = queue_.add(std::forward<Append>(append));
    if (!added) counters_.addDropped(DropReason::kClosed, 1);
    return added;
  }

  // Makes the queued records the taken ones, of which there are none; returns how many.
  virtual std::size_t takeRecords() = 0;
  // Gives the columns of that taken record to the statement. They live until the next call.
  virtual Bound bindRecord(std::size_t index, Statement& statement, PayloadEncoder& encoder) = 0;
  // Lets go of all taken records.
  virtual void forgetRecords() = 0;

 private:
  [[nodiscard]] SqliteCode writeNext(TransactionAllowance& allowance);
  void endTransaction(FinishedRecords& finished);

  const RecordTable& table_;
  WriterQueue& queue_;
  RecordCounters counters_;
  const std::uint64_t longestPayload_;

  // The writer's.
  PayloadEncoder encoder_;
  RecordSpans spans_;
  Statement insert_;
  std::size_t taken_ = 0;
  std::size_t next_ = 0;            // taken records before this are written
  std::uint64_t written_ = 0;       // records of the open transaction
  std::uint64_t writtenBytes_ = 0;  // and their payloads
  std::uint64_t tooLarge_ = 0;      // of them not stored
  OncePerSecond tooLargeLines_;
};

// The records of one kind. `Record` has `table` (its RecordTable), `time` in seconds since 1970,
// and `bind(Statement&, int firstColumn, PayloadEncoder&)`, which gives the statement its columns
// and returns the bytes of its payload.
template <typename Record>
class SimpleRecords final : public SimpleRecordKind {
 public:
  SimpleRecords(WriterQueue& queue, StatisticsService& statistics, std::uint64_t longestPayload)
      : SimpleRecordKind(Record::table, queue, statistics, longestPayload) {}

  // Queues a record. Waits while the queue is full; never for the disk. False when the store is
  // closed: then it is dropped and counted.
  bool add(Record record) {
    return addQueued([&] { queued_.push_back(std::move(record)); });
  }

 private:
  // A burst's memory is given back; what an ordinary round needs is kept.
  static constexpr std::size_t kKeptRecords = 8192;

  std::size_t takeRecords() override {
    forgetRecords();
    taken_.swap(queued_);
    return taken_.size();
  }
  Bound bindRecord(std::size_t index, Statement& statement, PayloadEncoder& encoder) override {
    // What was written before is not needed any more.
    bound_ = std::move(taken_[index]);
    return {bound_.time, bound_.bind(statement, kFirstColumn, encoder)};
  }
  void forgetRecords() override {
    bound_ = Record();
    taken_.clear();
    if (taken_.capacity() > kKeptRecords) taken_ = std::vector<Record>();
  }

  std::vector<Record> queued_;  // under the queue's lock
  std::vector<Record> taken_;   // the writer's
  Record bound_;                // the writer's: what the statement refers to
};

}  // namespace halvox::platform::linux_
