#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>
#include <utility>

#include "platform/linux/store/KindWithSpans.h"
#include "platform/linux/store/PayloadEncoder.h"
#include "platform/linux/store/RecordCounters.h"
#include "platform/linux/store/StoreLog.h"
#include "platform/linux/store/WriterQueue.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

// The part of SimpleRecords that concerns the length that a payload may have, and the counts of the
// open transaction. Threads, owner and failures are those of RecordKind.
class SpannedRecordKind : public KindWithSpans {
 public:
  [[nodiscard]] SqliteCode write(TransactionAllowance& allowance) final;
  void onCommitted(FinishedRecords& finished) final;
  std::uint64_t dropTaken(DropReason reason, FinishedRecords& finished) final;

 protected:
  // Pass constants, because the names are not copied.
  struct Names {
    std::string_view records;  // the table of the records
    std::string_view spans;    // the table of their spans
    std::string_view piece;    // the name under which the records are counted
  };

  // Does not own its arguments, which must outlive it. `longestPayload` is in bytes.
  SpannedRecordKind(const Names& names, WriterQueue& queue, StatisticsService& statistics,
                    std::uint64_t longestPayload)
      : KindWithSpans(names.records, names.spans),
        queue_(queue),
        counters_(statistics, names.piece),
        longestPayload_(longestPayload) {}

  // Waits for room in the queue, then runs `append`, which queues one record. If the store is
  // closed, counts the record as dropped and returns false.
  template <typename Append>
  bool addQueued(Append&& append) {
    // Count before add(), which may wait for room. The counts then include records whose callers
    // wait.
    counters_.addReceived();
    const bool added = queue_.add(std::forward<Append>(append));
    if (!added) counters_.addDropped(DropReason::kClosed, 1);
    return added;
  }

  // Adds records that share one payload to the counts of the open transaction. If the payload is
  // too long, counts the records as dropped and returns false; they must then not be written.
  [[nodiscard]] bool charge(TransactionAllowance& allowance, std::uint64_t records,
                            std::size_t payloadBytes);

  [[nodiscard]] PayloadEncoder& encoder() { return encoder_; }

 private:
  // Writes the next taken record.
  [[nodiscard]] virtual SqliteCode writeNext(TransactionAllowance& allowance) = 0;
  // Frees all taken records, after the last one was written or after a failed transaction. Returns
  // how many were not written.
  virtual std::uint64_t forgetTaken() = 0;
  // Logs that a record was dropped because its payload was longer than that many bytes.
  virtual void logTooLarge(std::uint64_t longestPayload) const = 0;
  void endTransaction(FinishedRecords& finished);

  WriterQueue& queue_;
  RecordCounters counters_;
  const std::uint64_t longestPayload_;

  // Used by the writer's thread only.
  PayloadEncoder encoder_;
  std::uint64_t written_ = 0;       // records in the open transaction, including tooLarge_
  std::uint64_t writtenBytes_ = 0;  // the length of their payloads
  std::uint64_t tooLarge_ = 0;      // records among written_ that were dropped for their length
  OncePerSecond tooLargeLines_;
};

}  // namespace halvox::platform::linux_
