#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <optional>
#include <vector>

#include "platform/clock.h"
#include "platform/linux/store/RecordCounters.h"
#include "platform/linux/store/RecordKind.h"
#include "platform/linux/store/StoreLog.h"
#include "platform/linux/store/WriterQueue.h"
#include "platform/linux/store/spool/LinkSpool.h"
#include "platform/linux/store/spool/SpoolRow.h"
#include "platform/linux/store/spool/SpoolTable.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// The messages that the link could not send yet, in the table link_spool. A row holds up to a
// thousand messages, and how many of its first ones were sent (SpoolRow.h). Retention deletes the
// oldest rows like other records, and counts the unsent messages in them as dropped.
//
// Threads, owner and failures are those of RecordKind. Any thread may call the functions up to
// onStored().
class SpooledMessages final : public RecordKind {
 public:
  using Number = LinkSpool::Number;

  // Does not own its arguments, which must outlive it. `longestMessage` is in bytes.
  SpooledMessages(WriterQueue& queue, StatisticsService& statistics, const ClockService& clock,
                  std::uint64_t longestMessage);

  // See LinkSpool.
  [[nodiscard]] Number append(SpooledMessage message);
  [[nodiscard]] Number lastAppended() const { return lastAppended_.load(); }
  [[nodiscard]] bool hasUnstored() const { return lastSettled_.load() < lastAppended_.load(); }
  void removeThrough(Number number);
  // Returns false after a failed transaction, until the next one succeeds.
  [[nodiscard]] bool canKeep() const { return canKeep_.load(); }
  void onStored(std::function<void()> stored) { stored_ = std::move(stored); }

  [[nodiscard]] SqliteCode prepare(Database& database) override;
  void release() override;
  void takeQueued() override;
  [[nodiscard]] bool hasTaken() const override;
  [[nodiscard]] SqliteCode write(TransactionAllowance& allowance) override;
  void onCommitted(FinishedRecords& finished) override;
  std::uint64_t dropTaken(DropReason reason, FinishedRecords& finished) override;
  [[nodiscard]] SqliteCode oldestTime(std::optional<double>& time) override;
  [[nodiscard]] SqliteCode deleteOldest(bool& found) override;
  [[nodiscard]] SqliteCode deleteOlderThan(double time, bool& found) override;
  [[nodiscard]] SqliteCode erase(Database& database, ErasePass& pass, bool& more) override {
    return SpoolTable::erase(database, pass, more);
  }

 private:
  struct Numbered {
    Number number;
    SpooledMessage message;
  };

  [[nodiscard]] SqliteCode writeRow(TransactionAllowance& allowance);
  [[nodiscard]] SqliteCode writeRemoval();
  [[nodiscard]] SqliteCode deleteRow(const SpoolTable::Row& row, Counter& counter,
                                     std::string_view why);
  void endTransaction(FinishedRecords& finished);
  void settleThrough(Number number);

  WriterQueue& queue_;
  const ClockService& clock_;
  const std::uint64_t longestMessage_;
  RecordCounters counters_;
  Counter& droppedForSize_;
  Counter& droppedForAge_;
  std::function<void()> stored_;

  std::atomic<Number> lastAppended_{0};
  std::atomic<Number> lastSettled_{0};  // stored or dropped
  std::atomic<Number> removeThrough_{0};
  std::atomic<bool> canKeep_{true};
  std::vector<Numbered> queued_;  // guarded by the lock of the WriterQueue

  // Used by the writer's thread only.
  Statement insert_;
  Statement removeSent_;
  Statement markSent_;
  SpoolTable table_;
  SpoolRowWriter row_;
  std::vector<Numbered> taken_;
  std::size_t next_ = 0;            // the first taken message that is not written yet
  std::uint64_t written_ = 0;       // in the open transaction, including tooLarge_
  std::uint64_t writtenBytes_ = 0;  // of their texts
  std::uint64_t tooLarge_ = 0;
  Number removed_ = 0;                // through this number, in committed transactions
  std::optional<Number> removedNow_;  // through this number, in the open transaction
  OncePerSecond dropLines_;
};

}  // namespace halvox::platform::linux_
