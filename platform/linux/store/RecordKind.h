#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include "platform/linux/store/Sqlite.h"

namespace halvox::platform::linux_ {

// Why records were not stored. The texts of these are the names of the counters.
enum class DropReason : std::uint8_t {
  kDiskFull,
  kLocked,
  kLogHeld,
  kDamaged,
  kInputOutput,
  kTooLarge,
  kClosed,
};
constexpr std::size_t kDropReasons = 7;
[[nodiscard]] std::string_view counterName(DropReason reason);

// What one transaction may still take.
struct TransactionAllowance {
  std::int64_t records;
  std::int64_t payloadBytes;
  [[nodiscard]] bool isUsedUp() const { return records <= 0 || payloadBytes <= 0; }
};

// Records that the writer is done with, for its queue.
struct FinishedRecords {
  std::uint64_t written = 0;
  std::uint64_t writtenBytes = 0;  // their payloads
  std::uint64_t unwritten = 0;     // dropped before they were written
};

// One kind of record of the store: its tables, the records of it that wait, and how they are
// written and deleted. The store owns its kinds and calls them on the writer's thread.
//
//   queued --takeQueued--> taken --write--> written --onCommitted--> stored
//                            |                 |
//                            +----dropTaken----+--> dropped, counted with the reason
class RecordKind {
 public:
  RecordKind() = default;
  RecordKind(const RecordKind&) = delete;
  RecordKind& operator=(const RecordKind&) = delete;
  virtual ~RecordKind() = default;

  // Prepares the statements, after each opening of the database.
  [[nodiscard]] virtual SqliteCode prepare(Database& database) = 0;
  // Lets go of all statements, before each closing.
  virtual void release() = 0;

  // Moves what is queued to the writer's side, where nothing is left. Runs under the queue's lock.
  virtual void takeQueued() = 0;
  [[nodiscard]] virtual bool hasTaken() const = 0;

  // Writes taken records into the open transaction, in order, until none is left or the allowance
  // is used up, which it reduces. After an error dropTaken() follows.
  [[nodiscard]] virtual SqliteCode write(TransactionAllowance& allowance) = 0;
  // The transaction's records are in the database. Adds them to the finished ones.
  virtual void onCommitted(FinishedRecords& finished) = 0;
  // The transaction failed: forgets its records and those that are taken but not written yet.
  // Adds them to the finished ones and returns how many were dropped.
  virtual std::uint64_t dropTaken(DropReason reason, FinishedRecords& finished) = 0;

  // The time of the oldest record (seconds since 1970); none when there is none.
  [[nodiscard]] virtual SqliteCode oldestTime(std::optional<double>& time) = 0;

  // Delete some records in the open transaction: the oldest, or only such as are older than that
  // (seconds since 1970). Without an error, `found` tells whether there were any; while it is true
  // there may be more.
  [[nodiscard]] virtual SqliteCode deleteOldest(bool& found) = 0;
  [[nodiscard]] virtual SqliteCode deleteOlderThan(double time, bool& found) = 0;
};

}  // namespace halvox::platform::linux_
