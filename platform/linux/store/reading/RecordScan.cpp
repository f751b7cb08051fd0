#include "platform/linux/store/reading/RecordScan.h"

#include <algorithm>
#include <utility>

#include <fnmatch.h>

#include "platform/linux/store/StoreSchema.h"

namespace halvox::platform::linux_ {
namespace {

// The first columns of the statement that reads records. The columns of the RecordTable follow.
enum Column : int { kID, kTime, kFirstColumn };

constexpr int columnOf(std::size_t field) { return kFirstColumn + static_cast<int>(field); }

SqliteCode readBound(Database& database, const std::string& sql, double time, std::int64_t& bound) {
  Statement statement;
  SqliteCode code = database.prepare(sql, statement);
  if (code != SQLITE_OK) return code;
  statement.bind(1, time);
  code = statement.step();
  if (code != SQLITE_ROW) return code;
  bound = statement.integer(0);
  return SQLITE_OK;
}

}  // namespace

SqliteCode findBounds(Database& database, const std::string& recordsTable,
                      const std::string& spansTable, const RecordFilter& filter,
                      RecordBounds& bounds) {
  SqliteCode code =
      readBound(database, "SELECT ifnull(max(id), 0) FROM " + recordsTable, 0, bounds.last);
  if (code == SQLITE_OK && filter.since.has_value()) {
    std::int64_t span = 0;
    // If no span is recent enough, begin with the newest span. Span 0 would make the scan read all
    // records.
    code = readBound(database,
                     "SELECT ifnull(min(span), (SELECT max(span) FROM " + spansTable + ")) FROM " +
                         spansTable + " WHERE last_time >= ?1",
                     *filter.since, span);
    bounds.first = std::max(bounds.first, span * kRecordsPerSpan);
  }
  if (code == SQLITE_OK && filter.until.has_value()) {
    std::int64_t span = 0;
    code = readBound(database,
                     "SELECT ifnull(max(span), -1) FROM " + spansTable + " WHERE first_time < ?1",
                     *filter.until, span);
    bounds.last = std::min(bounds.last, (span + 1) * kRecordsPerSpan - 1);
  }
  return code;
}

bool isWithinTimes(const RecordFilter& filter, double time) {
  return (!filter.since.has_value() || time >= *filter.since) &&
         (!filter.until.has_value() || time < *filter.until);
}

bool matchesAny(const std::vector<std::string>& patterns, const std::string& name) {
  return patterns.empty() || std::ranges::any_of(patterns, [&](const std::string& pattern) {
           return ::fnmatch(pattern.c_str(), name.c_str(), 0) == 0;
         });
}

SqliteCode RecordScan::begin() {
  // Record numbers begin with 1.
  bounds_.first = std::max<std::int64_t>(filter_.after + 1, 1);
  SqliteCode code = findBounds(database_, std::string(table_.records), std::string(table_.spans),
                               filter_, bounds_);
  if (filter_.before.has_value()) bounds_.last = std::min(bounds_.last, *filter_.before - 1);
  if (code == SQLITE_OK && filter_.newest.has_value()) code = skipToNewest(*filter_.newest);
  return code == SQLITE_OK ? prepare(filter_.order, read_) : code;
}

SqliteCode RecordScan::prepare(RecordOrder order, Statement& statement) {
  std::string sql = "SELECT id, time";
  for (const RecordColumn& column : table_.columns) sql.append(", ").append(column.name);
  sql.append(" FROM ").append(table_.records);
  sql.append(" WHERE id BETWEEN ?1 AND ?2 ORDER BY id");
  if (order == RecordOrder::kNewestFirst) sql.append(" DESC");
  return database_.prepare(sql, statement);
}

SqliteCode RecordScan::skipToNewest(std::uint64_t count) {
  Statement statement;
  // Read from the newest record backwards, to read no more records than needed.
  SqliteCode code = prepare(RecordOrder::kNewestFirst, statement);
  if (code != SQLITE_OK) return code;
  statement.bind(1, bounds_.first);
  statement.bind(2, bounds_.last);
  std::int64_t begin = bounds_.last + 1;
  for (std::uint64_t found = 0; found < count && (code = statement.step()) == SQLITE_ROW;) {
    if (!passes(statement)) continue;
    begin = statement.integer(kID);
    ++found;
  }
  if (code != SQLITE_OK && code != SQLITE_ROW && code != SQLITE_DONE) return code;
  bounds_.first = begin;
  return SQLITE_OK;
}

SqliteCode RecordScan::next(std::vector<StoredRecord>& piece) {
  piece.clear();
  read_.bind(1, bounds_.first);
  read_.bind(2, bounds_.last);
  std::size_t bytes = 0;
  SqliteCode code = SQLITE_DONE;
  for (int looks = 0; looks < kLooksPerPiece; ++looks) {
    code = read_.step();
    if (code != SQLITE_ROW) break;
    // Advance past a record that does not pass the filter, too. The next piece must not read it
    // again.
    if (filter_.order == RecordOrder::kNewestFirst) {
      bounds_.last = read_.integer(kID) - 1;
    } else {
      bounds_.first = read_.integer(kID) + 1;
    }
    if (passes(read_)) piece.push_back(read(read_, bytes));
    if (piece.size() >= kRecordsPerPiece || bytes >= kBytesPerPiece) break;
  }
  // End the snapshot before the caller's callback runs, because the callback may take any time.
  read_.reset();
  if (code == SQLITE_DONE) bounds_.first = bounds_.last + 1;
  return code == SQLITE_DONE || code == SQLITE_ROW ? SQLITE_OK : code;
}

bool RecordScan::passes(const Statement& row) const {
  // Make the cheap tests first. The caller's condition is the last test, because it needs the whole
  // record.
  if (!isWithinTimes(filter_, row.real(kTime))) return false;
  for (const NumberMatch& match : filter_.numbers) {
    const std::int64_t number = row.integer(columnOf(match.column));
    if (std::ranges::find(match.numbers, number) == match.numbers.end()) return false;
  }
  const bool hasName =
      table_.nameColumn == kNoColumn || filter_.names.empty() ||
      matchesAny(filter_.names, std::string(row.text(columnOf(table_.nameColumn))));
  if (!hasName || !filter_.accepts) return hasName;
  std::size_t ignored = 0;
  return filter_.accepts(read(row, ignored));
}

StoredRecord RecordScan::read(const Statement& row, std::size_t& bytes) const {
  StoredRecord record{row.integer(kID), row.real(kTime), {}};
  record.fields.reserve(table_.columns.size());
  for (std::size_t field = 0; field < table_.columns.size(); ++field) {
    const int column = columnOf(field);
    switch (table_.columns[field].type) {
      case ColumnType::kInteger:
        record.fields.emplace_back(row.integer(column));
        break;
      case ColumnType::kText:
        record.fields.emplace_back(std::string(row.text(column)));
        bytes += row.text(column).size();
        break;
      case ColumnType::kBytes:
        record.fields.emplace_back(std::string(row.bytes(column)));
        bytes += row.bytes(column).size();
        break;
    }
  }
  return record;
}

}  // namespace halvox::platform::linux_
