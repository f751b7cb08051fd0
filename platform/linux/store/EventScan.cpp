#include "platform/linux/store/EventScan.h"

#include <algorithm>
#include <string_view>

#include <fnmatch.h>

#include "platform/linux/store/StoreSchema.h"

namespace halvox::platform::linux_ {
namespace {

// The bounds of one piece: what it holds, and how long it keeps its snapshot.
constexpr std::size_t kEventsPerPiece = 512;
constexpr std::size_t kBytesPerPiece = 1U << 20U;
constexpr int kRecordsPerPiece = 50'000;

// Columns of the statements that read records.
enum Column : int { kID, kTime, kNameID, kTwinTime, kTwinNameID, kPayload };

constexpr std::int64_t recordOf(StoredEventID event) { return event / 2; }

}  // namespace

SqliteCode EventScan::begin() {
  first_ = recordOf(filter_.after);
  SqliteCode code = readBound("SELECT ifnull(max(id), 0) FROM analytics_records", 0, last_);
  if (code == SQLITE_OK && filter_.since.has_value()) {
    std::int64_t span = 0;
    code = readBound(
        "SELECT ifnull(min(span), (SELECT max(span) FROM analytics_spans))"
        " FROM analytics_spans WHERE last_time >= ?1",
        *filter_.since, span);
    first_ = std::max(first_, span * kRecordsPerSpan);
  }
  if (code == SQLITE_OK && filter_.until.has_value()) {
    std::int64_t span = 0;
    code = readBound("SELECT ifnull(max(span), -1) FROM analytics_spans WHERE first_time < ?1",
                     *filter_.until, span);
    last_ = std::min(last_, (span + 1) * kRecordsPerSpan - 1);
  }
  if (code == SQLITE_OK && filter_.newest.has_value()) code = skipToNewest(*filter_.newest);
  if (code != SQLITE_OK) return code;
  return database_.prepare(
      "SELECT id, time, name_id, twin_time, twin_name_id, payload FROM analytics_records"
      " WHERE id BETWEEN ?1 AND ?2 ORDER BY id",
      read_);
}

SqliteCode EventScan::readBound(std::string_view sql, double time, std::int64_t& bound) {
  Statement statement;
  SqliteCode code = database_.prepare(sql, statement);
  if (code != SQLITE_OK) return code;
  statement.bind(1, time);
  code = statement.step();
  if (code != SQLITE_ROW) return code;
  bound = statement.integer(0);
  return SQLITE_OK;
}

SqliteCode EventScan::skipToNewest(std::uint64_t count) {
  Statement statement;
  SqliteCode code = database_.prepare(
      "SELECT id, time, name_id, twin_time, twin_name_id FROM analytics_records"
      " WHERE id BETWEEN ?1 AND ?2 ORDER BY id DESC",
      statement);
  if (code != SQLITE_OK) return code;
  statement.bind(1, first_);
  statement.bind(2, last_);
  StoredEventID begin = 2 * (last_ + 1);
  std::uint64_t found = 0;
  while (found < count && (code = statement.step()) == SQLITE_ROW) {
    for (const int which : {1, 0}) {
      Event event{};
      if (found >= count || !readEvent(statement, which, event)) continue;
      begin = event.id;
      ++found;
    }
  }
  if (code != SQLITE_OK && code != SQLITE_ROW && code != SQLITE_DONE) return code;
  after_ = std::max(after_, begin - 1);
  first_ = recordOf(begin);
  return SQLITE_OK;
}

SqliteCode EventScan::next(Piece& piece) {
  piece.events.clear();
  piece.payloads.clear();
  read_.bind(1, first_);
  read_.bind(2, last_);
  std::size_t bytes = 0;
  SqliteCode code = SQLITE_DONE;
  for (int records = 0; records < kRecordsPerPiece; ++records) {
    code = read_.step();
    if (code != SQLITE_ROW) break;
    first_ = read_.integer(kID) + 1;
    bool hasPayload = false;
    for (const int which : {0, 1}) {
      Event event{};
      if (!readEvent(read_, which, event)) continue;
      if (!hasPayload) {
        piece.payloads.emplace_back(read_.text(kPayload));
        bytes += piece.payloads.back().size();
        hasPayload = true;
      }
      event.payload = piece.payloads.size() - 1;
      piece.events.push_back(event);
    }
    if (piece.events.size() >= kEventsPerPiece || bytes >= kBytesPerPiece) break;
  }
  read_.reset();
  if (code == SQLITE_DONE) first_ = last_ + 1;
  return code == SQLITE_DONE || code == SQLITE_ROW ? SQLITE_OK : code;
}

bool EventScan::readEvent(const Statement& row, int which, Event& event) {
  const bool isTwin = which == 1;
  if (isTwin && row.isNull(kTwinNameID)) return false;
  event.id = 2 * row.integer(kID) + which;
  event.time = row.real(isTwin ? kTwinTime : kTime);
  event.nameID = row.integer(isTwin ? kTwinNameID : kNameID);
  return passes(event);
}

bool EventScan::passes(const Event& event) {
  return event.id > after_ && (!filter_.since.has_value() || event.time >= *filter_.since) &&
         (!filter_.until.has_value() || event.time < *filter_.until) && name(event.nameID).matches;
}

// Looked up one by one: there are few, and a service may add some between two pieces.
const EventScan::Name& EventScan::name(std::int64_t nameID) {
  const auto known = names_.find(nameID);
  if (known != names_.end()) return known->second;
  Name& added = names_[nameID];
  Statement statement;
  if (database_.prepare("SELECT name FROM event_names WHERE id = ?1", statement) == SQLITE_OK) {
    statement.bind(1, nameID);
    if (statement.step() == SQLITE_ROW) added.text = statement.text(0);
  }
  added.matches = ::fnmatch(filter_.name.c_str(), added.text.c_str(), 0) == 0;
  return added;
}

}  // namespace halvox::platform::linux_
