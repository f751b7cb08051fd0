#pragma once

#include <cstdint>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/linux/store/RecordTables.h"
#include "platform/linux/store/SpannedRecordKind.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// The part of SimpleRecords that does not depend on the type of the record. Threads, owner and
// failures are those of RecordKind.
class SimpleRecordKind : public SpannedRecordKind {
 public:
  [[nodiscard]] SqliteCode prepare(Database& database) final;
  void release() final;
  void takeQueued() final;
  [[nodiscard]] bool hasTaken() const final { return next_ < taken_; }

 protected:
  // The INSERT parameter of the first column in RecordTable::columns. Parameter 1 is the ID,
  // parameter 2 the time.
  static constexpr int kFirstColumn = 3;

  // Facts about the record that was bound to the INSERT.
  struct Bound {
    double time;
    std::size_t bytes;  // the length of the payload
  };

  // Does not own its arguments, which must outlive it. `longestPayload` is in bytes.
  SimpleRecordKind(const RecordTable& table, WriterQueue& queue, StatisticsService& statistics,
                   std::uint64_t longestPayload);

  // Moves all queued records to the list of taken records, and returns their number.
  virtual std::size_t takeRecords() = 0;
  // Binds the columns of a taken record to the statement. The bound values stay valid until the
  // next call.
  virtual Bound bindRecord(std::size_t index, Statement& statement, PayloadEncoder& encoder) = 0;
  // Frees all taken records.
  virtual void forgetRecords() = 0;

 private:
  [[nodiscard]] SqliteCode writeNext(TransactionAllowance& allowance) final;
  std::uint64_t forgetTaken() final;
  void logTooLarge(std::uint64_t longestPayload) const final;

  const RecordTable& table_;

  // Used by the writer's thread only.
  Statement insert_;
  std::size_t taken_ = 0;
  std::size_t next_ = 0;  // the first taken record that is not written yet
};

// One kind of record of which each has a row of its own. `Record` has the members `table` (its
// RecordTable), `time` (seconds since 1970) and `bind`; see StoreRecords.h.
template <typename Record>
class SimpleRecords final : public SimpleRecordKind {
 public:
  SimpleRecords(WriterQueue& queue, StatisticsService& statistics, std::uint64_t longestPayload)
      : SimpleRecordKind(Record::table, queue, statistics, longestPayload) {}

  // Any thread. Queues a record. Waits while the queue is full, but never for the disk itself. If
  // the store is closed, drops and counts the record and returns false.
  bool add(Record record) {
    return addQueued([&] { queued_.push_back(std::move(record)); });
  }

 private:
  // Between rounds, keep memory for this many records, which is the soft limit of the queue. Free
  // the memory that a burst needed beyond that.
  static constexpr std::size_t kKeptRecords = 8192;

  std::size_t takeRecords() override {
    forgetRecords();
    taken_.swap(queued_);
    return taken_.size();
  }
  Bound bindRecord(std::size_t index, Statement& statement, PayloadEncoder& encoder) override {
    // The assignment frees the previous record. Memory therefore shrinks while a large batch is
    // written.
    bound_ = std::move(taken_[index]);
    return {bound_.time, bound_.bind(statement, kFirstColumn, encoder)};
  }
  void forgetRecords() override {
    bound_ = Record();
    taken_.clear();
    if (taken_.capacity() > kKeptRecords) taken_ = std::vector<Record>();
  }

  std::vector<Record> queued_;  // guarded by the lock of the WriterQueue
  // Used by the writer's thread only.
  std::vector<Record> taken_;
  Record bound_;  // owns the texts and bytes that are bound to the statement
};

}  // namespace halvox::platform::linux_
