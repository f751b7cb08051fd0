#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include "platform/linux/store/Sqlite.h"

namespace halvox::platform::linux_ {

// The numbers and the times of one kind's records: gives each record its number, keeps the first
// and the last time of each run of records, and deletes the oldest records by number or by time.
// Belongs to the writer's thread; everything happens in the open transaction.
class RecordSpans {
 public:
  // The tables as the schema makes them; the texts are constants.
  RecordSpans(std::string_view records, std::string_view spans)
      : recordsTable_(records), spansTable_(spans) {}

  // Prepares the statements, after each opening of the database.
  [[nodiscard]] SqliteCode prepare(Database& database);
  // Lets go of all statements, before each closing.
  void release() { statements_ = {}; }

  // The number of the next record. Numbers only grow, even when all records were deleted.
  [[nodiscard]] std::int64_t next() const { return next_; }
  // The record of that number has that time (seconds since 1970).
  [[nodiscard]] SqliteCode note(double time);
  // The record of that number is written.
  void advance() { ++next_; }
  // Writes what was noted; before the commit.
  [[nodiscard]] SqliteCode flush();
  void onCommitted() { nextCommitted_ = next_; }
  // The transaction failed: its numbers are given again.
  void onRolledBack();

  // The time of the oldest record, when there is one.
  [[nodiscard]] SqliteCode oldestTime(std::optional<double>& time);
  // As RecordKind has it.
  [[nodiscard]] SqliteCode deleteOldest(bool& found);
  [[nodiscard]] SqliteCode deleteOlderThan(double time, bool& found);

 private:
  struct Statements {
    Statement noteSpan;
    Statement oldestRecord;
    Statement deleteRecords;
    Statement deleteEmptySpans;
    Statement agedSpan;
    Statement deleteAgedRecords;
    Statement shortenSpan;
  };
  // The times of a run of records; see the schema.
  struct Span {
    std::int64_t number = -1;
    double firstTime = 0;
    double lastTime = 0;
  };

  [[nodiscard]] SqliteCode readNext(Database& database);

  const std::string_view recordsTable_;
  const std::string_view spansTable_;
  Statements statements_;
  Span span_;
  std::int64_t next_ = 1;
  std::int64_t nextCommitted_ = 1;
};

}  // namespace halvox::platform::linux_
