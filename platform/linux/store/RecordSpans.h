#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include "platform/linux/store/Sqlite.h"

namespace halvox::platform::linux_ {

struct ErasePass;

// Numbers the records of one kind, and stores the first and the last time of each span of
// kRecordsPerSpan records. Deletes the oldest records by number, or by time with the help of the
// spans, which make an index on the time unnecessary.
// Owned by a RecordKind and used by the writer's thread only. Works in the open transaction, except
// for prepare(). Functions that use the database return SQLITE_OK or an error.
//
// For each record: note() its times, then advance(). Before the commit: flush().
class RecordSpans {
 public:
  // The names of the kind's tables. Pass constants, because the names are not copied.
  RecordSpans(std::string_view records, std::string_view spans)
      : recordsTable_(records), spansTable_(spans) {}

  // Prepares the statements and reads the next number, after each opening of the database.
  [[nodiscard]] SqliteCode prepare(Database& database);
  // Finalizes all statements, before each closing of the database.
  void release() { statements_ = {}; }

  // Returns the number of the next record. Numbers only grow, even after all records were deleted,
  // because readers that follow the store rely on it.
  [[nodiscard]] std::int64_t next() const { return next_; }
  // Adds a time (seconds since 1970) to the span of the next record.
  [[nodiscard]] SqliteCode note(double time);
  // Increases next(). Call it when the record with the number next() has been written.
  void advance() { ++next_; }
  // Writes the times of the current span.
  [[nodiscard]] SqliteCode flush();
  void onCommitted() { nextCommitted_ = next_; }
  // Called after a failed transaction. The numbers of its records will be used again.
  void onRolledBack();

  // See RecordKind.
  [[nodiscard]] SqliteCode oldestTime(std::optional<double>& time);
  [[nodiscard]] SqliteCode deleteOldest(bool& found);
  [[nodiscard]] SqliteCode deleteOlderThan(double time, bool& found);
  [[nodiscard]] SqliteCode erase(Database& database, ErasePass& pass, bool& more);

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
  // The times in the current span that flush() has not written yet.
  struct Span {
    std::int64_t number = -1;
    double firstTime = 0;
    double lastTime = 0;
  };

  [[nodiscard]] SqliteCode readNext(Database& database);
  [[nodiscard]] SqliteCode keepNext(Database& database) const;

  const std::string_view recordsTable_;
  const std::string_view spansTable_;
  Statements statements_;
  Span span_;
  std::int64_t next_ = 1;
  std::int64_t nextCommitted_ = 1;
};

}  // namespace halvox::platform::linux_
