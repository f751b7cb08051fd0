#include "platform/linux/store/RecordSpans.h"

#include <algorithm>
#include <string>
#include <utility>
#include <vector>

#include "platform/linux/store/EraseSelection.h"
#include "platform/linux/store/RecordKind.h"
#include "platform/linux/store/StoreSchema.h"

namespace halvox::platform::linux_ {
namespace {

// How many records deleteOldest() deletes. The number is small, because payloads may be large and
// retention must measure the free space after each step.
constexpr std::int64_t kRecordsPerStep = 64;

// Returns the statement with the names of the tables in place of $records and $spans.
std::string withTables(std::string_view sql, std::string_view records, std::string_view spans) {
  std::string result(sql);
  for (const auto& [place, name] :
       {std::pair<std::string_view, std::string_view>{"$records", records}, {"$spans", spans}}) {
    for (std::size_t at = 0; (at = result.find(place, at)) != std::string::npos;) {
      result.replace(at, place.size(), name);
      at += name.size();
    }
  }
  return result;
}

// Returns what an erasure must know of the row, whichever table it is of.
ErasableRecord erasableRow(const Statement& row) {
  ErasableRecord record;
  for (int column = 0; column < row.columns(); ++column) {
    const std::string_view name = row.columnName(column);
    if (name == "name_id") record.kind = ErasableRecord::Kind::kEvent;
    if (name == "session_id") {
      record.kind = ErasableRecord::Kind::kLink;
      record.sessionID = row.integer(column);
    }
    if (name == "payload" || name == "signature" || name == "message") {
      record.payload = row.bytes(column);
    }
    // The record of a capture. An erasure deletes the captures themselves too.
    record.isOfAll = record.isOfAll || name == "path";
  }
  return record;
}

}  // namespace

SqliteCode RecordSpans::prepare(Database& database) {
  const SqliteCode read = readNext(database);
  if (read != SQLITE_OK) return read;
  for (const auto& [statement, sql] :
       {std::pair<Statement*, std::string_view>{
            &statements_.noteSpan,
            "INSERT INTO $spans VALUES (?1, ?2, ?3) ON CONFLICT(span) DO UPDATE SET"
            " first_time = min(first_time, excluded.first_time),"
            " last_time = max(last_time, excluded.last_time)"},
        {&statements_.oldestRecord, "SELECT id, time FROM $records ORDER BY id LIMIT 1"},
        {&statements_.deleteRecords, "DELETE FROM $records WHERE id BETWEEN ?1 AND ?2"},
        // Keep the newest span even if its records are deleted, because the next number derives
        // from it.
        {&statements_.deleteEmptySpans,
         "DELETE FROM $spans WHERE span < ?1 AND span < (SELECT max(span) FROM $spans)"},
        {&statements_.agedSpan,
         "SELECT span FROM $spans WHERE first_time < ?1 ORDER BY span LIMIT 1"},
        {&statements_.deleteAgedRecords,
         "DELETE FROM $records WHERE id BETWEEN ?1 AND ?2 AND time < ?3"},
        {&statements_.shortenSpan,
         "UPDATE $spans SET first_time = max(first_time, ?2) WHERE span = ?1"}}) {
    const SqliteCode code =
        database.prepare(withTables(sql, recordsTable_, spansTable_), *statement);
    if (code != SQLITE_OK) return code;
  }
  return SQLITE_OK;
}

SqliteCode RecordSpans::readNext(Database& database) {
  Statement statement;
  SqliteCode code = database.prepare(withTables("SELECT ifnull((SELECT max(id) FROM $records), 0),"
                                                " ifnull((SELECT max(span) FROM $spans), -1)",
                                                recordsTable_, spansTable_),
                                     statement);
  if (code != SQLITE_OK) return code;
  code = statement.step();
  if (code != SQLITE_ROW) return code;
  const std::int64_t newest = statement.integer(0);
  const std::int64_t span = statement.integer(1);
  // If all records of the newest span were deleted, it is not known which of its numbers were used.
  // Continue with the first number of the next span.
  const bool isUsedUp = span > newest / kRecordsPerSpan || (newest == 0 && span == 0);
  next_ = nextCommitted_ = isUsedUp ? (span + 1) * kRecordsPerSpan : newest + 1;
  span_ = {};
  return SQLITE_OK;
}

SqliteCode RecordSpans::note(double time) {
  const std::int64_t number = next_ / kRecordsPerSpan;
  if (number == span_.number) {
    span_.firstTime = std::min(span_.firstTime, time);
    span_.lastTime = std::max(span_.lastTime, time);
    return SQLITE_OK;
  }
  // This is the first record of the next span. The times of the previous span are complete and can
  // be written.
  const SqliteCode code = flush();
  span_ = {number, time, time};
  return code;
}

SqliteCode RecordSpans::flush() {
  if (span_.number < 0) return SQLITE_OK;
  Statement& statement = statements_.noteSpan;
  statement.bind(1, span_.number);
  statement.bind(2, span_.firstTime);
  statement.bind(3, span_.lastTime);
  span_ = {};
  return statement.run();
}

void RecordSpans::onRolledBack() {
  next_ = nextCommitted_;
  span_ = {};
}

SqliteCode RecordSpans::oldestTime(std::optional<double>& time) {
  time.reset();
  const SqliteCode code = statements_.oldestRecord.step();
  if (code == SQLITE_ROW) time = statements_.oldestRecord.real(1);
  statements_.oldestRecord.reset();
  return code == SQLITE_ROW || code == SQLITE_DONE ? SQLITE_OK : code;
}

SqliteCode RecordSpans::deleteOldest(bool& found) {
  SqliteCode code = statements_.oldestRecord.step();
  found = code == SQLITE_ROW;
  const std::int64_t first = found ? statements_.oldestRecord.integer(0) : 0;
  statements_.oldestRecord.reset();
  if (!found) return code == SQLITE_DONE ? SQLITE_OK : code;

  statements_.deleteRecords.bind(1, first);
  statements_.deleteRecords.bind(2, first + kRecordsPerStep - 1);
  code = statements_.deleteRecords.run();
  if (code != SQLITE_OK) return code;
  // Delete only spans whose records are all deleted. The span of the oldest remaining record stays.
  statements_.deleteEmptySpans.bind(1, (first + kRecordsPerStep) / kRecordsPerSpan);
  return statements_.deleteEmptySpans.run();
}

SqliteCode RecordSpans::deleteOlderThan(double time, bool& found) {
  statements_.agedSpan.bind(1, time);
  SqliteCode code = statements_.agedSpan.step();
  found = code == SQLITE_ROW;
  const std::int64_t span = found ? statements_.agedSpan.integer(0) : 0;
  statements_.agedSpan.reset();
  if (!found) return code == SQLITE_DONE ? SQLITE_OK : code;

  statements_.deleteAgedRecords.bind(1, span * kRecordsPerSpan);
  statements_.deleteAgedRecords.bind(2, (span + 1) * kRecordsPerSpan - 1);
  statements_.deleteAgedRecords.bind(3, time);
  code = statements_.deleteAgedRecords.run();
  if (code != SQLITE_OK) return code;
  // Raise the span's first time to the limit. The next call would otherwise find the same span
  // again. If the span's oldest record is in truth newer than the limit, a later call examines the
  // span once without need. The row of the span stays; deleteOldest() deletes it together with
  // later records.
  statements_.shortenSpan.bind(1, span);
  statements_.shortenSpan.bind(2, time);
  return statements_.shortenSpan.run();
}

SqliteCode RecordSpans::erase(Database& database, ErasePass& pass, bool& more) {
  more = false;
  if (pass.last < 0) pass.last = next_ - 1;
  Statement rows;
  SqliteCode code = database.prepare(
      withTables("SELECT * FROM $records WHERE id BETWEEN ?1 AND ?2 ORDER BY id LIMIT ?3",
                 recordsTable_, spansTable_),
      rows);
  if (code != SQLITE_OK) return code;
  rows.bind(1, pass.next);
  rows.bind(2, pass.last);
  rows.bind(3, kRecordsPerStep);
  std::vector<std::int64_t> selected;
  while ((code = rows.step()) == SQLITE_ROW) {
    more = true;
    pass.next = rows.integer(0) + 1;
    const ErasableRecord record = erasableRow(rows);
    if (pass.isLooking) {
      pass.selection->look(record);
    } else if (pass.selection->selects(record)) {
      selected.push_back(rows.integer(0));
    }
  }
  rows.reset();
  if (code != SQLITE_DONE) return code;
  for (const std::int64_t id : selected) {
    statements_.deleteRecords.bind(1, id);
    statements_.deleteRecords.bind(2, id);
    code = statements_.deleteRecords.run();
    if (code != SQLITE_OK) return code;
  }
  pass.erased += selected.size();
  return selected.empty() ? SQLITE_OK : keepNext(database);
}

// The next number derives from the newest record. If that was erased, adds an empty span, after
// which numbering continues when the database is opened again.
SqliteCode RecordSpans::keepNext(Database& database) const {
  Statement add;
  const SqliteCode code = database.prepare(
      withTables("INSERT OR IGNORE INTO $spans SELECT ?2, last_time, last_time FROM $spans"
                 " WHERE span = ?2 - 1 AND ifnull((SELECT max(id) FROM $records), 0) < ?1",
                 recordsTable_, spansTable_),
      add);
  if (code != SQLITE_OK) return code;
  add.bind(1, nextCommitted_ - 1);
  add.bind(2, (nextCommitted_ - 1) / kRecordsPerSpan + 1);
  return add.run();
}

}  // namespace halvox::platform::linux_
