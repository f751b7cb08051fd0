#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include "platform/linux/store/Sqlite.h"

namespace halvox::platform::linux_ {

// Why records were dropped instead of stored.
enum class DropReason : std::uint8_t {
  kDiskFull,     // no space, over a quota, or over a limit on the size of files
  kLocked,       // another process kept the database locked
  kLogHeld,      // a reader keeps the write-ahead log from being reused, and the log is full
  kDamaged,      // the file turned out to be broken
  kInputOutput,  // any other failure of SQLite or of the system
  kTooLarge,     // the payload is longer than StoreSizes::payloadBytes
  kClosed,       // the record was added after SqliteStore::close()
};
constexpr std::size_t kDropReasons = 7;
// Returns the name of the counter for that reason, such as "dropped: disk full".
[[nodiscard]] std::string_view counterName(DropReason reason);

// How much may still be written into the open transaction.
struct TransactionAllowance {
  std::int64_t records;
  std::int64_t payloadBytes;
  [[nodiscard]] bool isUsedUp() const { return records <= 0 || payloadBytes <= 0; }
};

// How many records no longer wait, because they were stored or dropped. WriterQueue::finish() needs
// these numbers.
struct FinishedRecords {
  std::uint64_t written = 0;       // written into a transaction, committed or not
  std::uint64_t writtenBytes = 0;  // the length of their payloads
  std::uint64_t unwritten = 0;     // dropped before they were written
};

class EraseSelection;

// How far an erasure has come with the records of one kind.
struct ErasePass {
  EraseSelection* selection;  // not owned
  bool isLooking = true;      // only looks at the records; otherwise erases
  std::int64_t next = 0;      // the first number that was not visited
  std::int64_t last = -1;     // the newest number when the erasure began; later records stay
  std::uint64_t erased = 0;   // records
};

// One kind of record: its tables, its waiting records, and the code that writes and deletes them.
// The store owns its kinds. Only the writer's thread calls the functions of this class. Derived
// classes have a function that adds records, which any thread may call. Functions that use the
// database return an SQLite code; after an error the store rolls back and calls dropTaken().
//
//   queued --takeQueued--> taken --write--> written --onCommitted--> stored
//                            |                 |
//                            +----dropTaken----+--> dropped, counted under the reason
class RecordKind {
 public:
  RecordKind() = default;
  RecordKind(const RecordKind&) = delete;
  RecordKind& operator=(const RecordKind&) = delete;
  virtual ~RecordKind() = default;

  // Prepares the statements, after each opening of the database.
  [[nodiscard]] virtual SqliteCode prepare(Database& database) = 0;
  // Finalizes all statements, before each closing of the database.
  virtual void release() = 0;

  // Moves all queued records to the list of taken records, which must be empty. The caller holds
  // the lock of the WriterQueue.
  virtual void takeQueued() = 0;
  // Returns true while taken records wait to be written.
  [[nodiscard]] virtual bool hasTaken() const = 0;

  // Writes taken records into the open transaction, in order, until none remains or the allowance
  // is used up. Subtracts the written records and their bytes from the allowance.
  [[nodiscard]] virtual SqliteCode write(TransactionAllowance& allowance) = 0;
  // Called after a successful commit. Counts the records as stored and adds them to `finished`.
  virtual void onCommitted(FinishedRecords& finished) = 0;
  // Called after a failure. Drops the records of the transaction and the taken records that are not
  // written yet, counts them under the reason and adds them to `finished`. Returns their number.
  virtual std::uint64_t dropTaken(DropReason reason, FinishedRecords& finished) = 0;

  // Sets `time` to the time of the oldest record (seconds since 1970), or to std::nullopt if there
  // is no record.
  [[nodiscard]] virtual SqliteCode oldestTime(std::optional<double>& time) = 0;

  // These functions delete a few records in the open transaction: the oldest ones, or some that are
  // older than `time` (seconds since 1970). They set `found` to whether there were any. Call them
  // again while it is true.
  [[nodiscard]] virtual SqliteCode deleteOldest(bool& found) = 0;
  [[nodiscard]] virtual SqliteCode deleteOlderThan(double time, bool& found) = 0;

  // Visits the next few records of a pass in the open transaction, and deletes those that it
  // selects. The numbers of other records stay. Sets `more` to whether records remain.
  [[nodiscard]] virtual SqliteCode erase(Database& database, ErasePass& pass, bool& more) = 0;
};

}  // namespace halvox::platform::linux_
