#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <string_view>

#include "platform/linux/store/Sqlite.h"
#include "platform/linux/store/blocks/MessageBlockReader.h"
#include "platform/linux/store/blocks/MessageBlockWriter.h"

namespace halvox::platform::linux_ {

struct ErasePass;

// Writes and deletes the rows of `message_blocks`. Each row holds one or more consecutive records;
// its ID is the number of the first one. Record numbers only grow, even after all records were
// deleted, because readers that follow the store rely on it.
//
//   open     few records, as they came in one transaction; the newest rows, without a span
//   sealed   many records, compressed, with a row of `message_spans`
//
// A transaction of many records writes only sealed blocks. A transaction of few records writes them
// at once, into an open row, because answered messages must be in the database soon. When the open
// rows have enough records, a later transaction makes them one sealed block with the same numbers.
// There is no timer for this: the open rows of a quiet store stay open, and readers read them like
// all others.
//
// Owned by MessageRecords and used by the writer's thread only. Works in the open transaction,
// except for prepare(). Functions that use the database return SQLITE_OK or an error; after an
// error the caller rolls back and calls onRolledBack().
//
//   begin(); addEvent(), addLink() ...; end(); then onCommitted() or onRolledBack()
class MessageBlocks {
 public:
  // Open rows become a sealed block when they have this many records, which are 85 messages with
  // two events and a link message each. Fewer would cost space: messages take twice as many bytes
  // in blocks of 32 messages as in blocks of 340.
  static constexpr std::uint64_t kRecordsToSeal = 256;

  // Prepares the statements, after each opening of the database.
  [[nodiscard]] SqliteCode prepare(Database& database);
  // Finalizes all statements, before each closing of the database.
  void release();
  // Frees what only frequent writing needs. Do not call inside a transaction.
  void releaseMemory() { writer_.release(); }

  // Begins to write a transaction of about `records` records.
  [[nodiscard]] SqliteCode begin(std::uint64_t records);
  // See MessageBlockWriter.
  [[nodiscard]] SqliteCode addEvent(double time, const EventHead& head, std::string_view payload);
  [[nodiscard]] SqliteCode addLink(double time, const LinkHead& head, std::string_view payload);
  // Writes the records that are not in a row yet.
  [[nodiscard]] SqliteCode end();
  // Returns the length of this transaction's records before compression, in bytes.
  [[nodiscard]] std::uint64_t bytes() const { return sealedBytes_ + writer_.bytes(); }

  void onCommitted();
  // Called after a failed transaction. The numbers of its records will be used again.
  void onRolledBack();

  // See RecordKind.
  [[nodiscard]] SqliteCode oldestTime(std::optional<double>& time);
  [[nodiscard]] SqliteCode deleteOldest(bool& found);
  // Deletes the records of one block that are older than `time`. If newer records remain, writes
  // the block again with gaps.
  [[nodiscard]] SqliteCode deleteOlderThan(double time, bool& found);
  // Visits the records of one block. If only some are erased, writes the block again with gaps. A
  // block of gaps stays, because readers that follow the store would miss its numbers.
  [[nodiscard]] SqliteCode erase(Database& database, ErasePass& pass, bool& more);

 private:
  enum class Row : std::uint8_t { kOpen, kSealed };
  struct Statements {
    Statement insertBlock;
    Statement insertSpan;
    Statement newest;
    Statement openRows;
    Statement deleteOpenRows;
    Statement oldest;
    Statement agedSpan;
    Statement agedOpenRow;
    Statement block;
    Statement deleteBlock;
    Statement deleteSpan;
  };
  // The records in writer_.
  struct Gathered {
    std::int64_t first = 0;  // the number of the first
    bool hasTimes = false;
    double firstTime = 0;
    double lastTime = 0;
    // A time for a block of gaps, by which retention deletes it.
    double timeOfGaps = 0;
  };
  // A row, copied.
  struct StoredBlock {
    std::int64_t id = 0;
    std::int64_t records = 0;
    double lastTime = 0;
    std::string block;
  };
  // Returns true for a record that becomes a gap. The number is that in the block, from 0.
  using IsGone = std::function<bool(std::int64_t number, const BlockRecord& record)>;

  [[nodiscard]] SqliteCode readState();
  [[nodiscard]] SqliteCode sealOpenRows();
  [[nodiscard]] SqliteCode sealEachOpenRow();
  [[nodiscard]] SqliteCode gatherOpenRows();
  [[nodiscard]] SqliteCode gatherBlock(std::string_view block, std::int64_t records,
                                       const IsGone& isGone);
  void note(double time);
  [[nodiscard]] SqliteCode afterAdding();
  [[nodiscard]] SqliteCode insert(Row row);
  [[nodiscard]] SqliteCode insertSpan();
  void clearGathered();
  [[nodiscard]] SqliteCode deleteRow(std::int64_t id, std::int64_t records);
  [[nodiscard]] SqliteCode trim(std::int64_t id, double time);
  [[nodiscard]] SqliteCode rewrite(const StoredBlock& row, const IsGone& isGone);
  [[nodiscard]] SqliteCode visit(const StoredBlock& row, ErasePass& pass);

  Statements statements_;
  MessageBlockWriter writer_;
  Gathered gathered_;
  std::uint64_t sealedBytes_ = 0;  // of the blocks that this transaction has written

  // True if the members below are known: after readState(), until the database is opened again or a
  // transaction is rolled back.
  bool isStateKnown_ = false;
  std::int64_t next_ = 1;        // the number of the next record
  std::int64_t firstOpen_ = 1;   // the number of the first record in an open row
  std::uint64_t openBytes_ = 0;  // of the open rows
};

}  // namespace halvox::platform::linux_
