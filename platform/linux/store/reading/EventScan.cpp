#include "platform/linux/store/reading/EventScan.h"

#include <algorithm>
#include <string_view>

namespace halvox::platform::linux_ {
namespace {

// The columns of the statements that read records.
enum Column : int { kID, kTime, kNameID, kTwinTime, kTwinNameID, kPayload };

constexpr std::int64_t recordOf(StoredRecordID event) { return event / 2; }

}  // namespace

SqliteCode EventScan::begin() {
  // Begin with the record that holds the event `after`, because its second event may be newer.
  bounds_.first = recordOf(filter_.after);
  SqliteCode code = findBounds(database_, "analytics_records", "analytics_spans", filter_, bounds_);
  if (filter_.before.has_value()) {
    bounds_.last = std::min(bounds_.last, recordOf(*filter_.before - 1));
  }
  if (code == SQLITE_OK && filter_.newest.has_value()) code = skipToNewest(*filter_.newest);
  if (code != SQLITE_OK) return code;
  return database_.prepare(
      std::string("SELECT id, time, name_id, twin_time, twin_name_id, payload"
                  " FROM analytics_records WHERE id BETWEEN ?1 AND ?2 ORDER BY id") +
          (filter_.order == RecordOrder::kNewestFirst ? " DESC" : ""),
      read_);
}

SqliteCode EventScan::skipToNewest(std::uint64_t count) {
  Statement statement;
  // The payload is long: it is read only for a condition that may need it.
  const std::string payload = filter_.acceptsEvent ? ", payload" : "";
  SqliteCode code =
      database_.prepare("SELECT id, time, name_id, twin_time, twin_name_id" + payload +
                            " FROM analytics_records WHERE id BETWEEN ?1 AND ?2 ORDER BY id DESC",
                        statement);
  if (code != SQLITE_OK) return code;
  statement.bind(1, bounds_.first);
  statement.bind(2, bounds_.last);
  StoredRecordID begin = 2 * (bounds_.last + 1);
  std::uint64_t found = 0;
  while (found < count && (code = statement.step()) == SQLITE_ROW) {
    // Read the twin first, because this loop goes from the newest event backwards.
    for (const int which : {1, 0}) {
      Event event{};
      if (found >= count || !readEvent(statement, which, event)) continue;
      begin = event.id;
      ++found;
    }
  }
  if (code != SQLITE_OK && code != SQLITE_ROW && code != SQLITE_DONE) return code;
  // Exclude the first event of the first record if only its twin is among the newest.
  after_ = std::max(after_, begin - 1);
  bounds_.first = recordOf(begin);
  return SQLITE_OK;
}

SqliteCode EventScan::next(Piece& piece) {
  piece.events.clear();
  piece.payloads.clear();
  read_.bind(1, bounds_.first);
  read_.bind(2, bounds_.last);
  std::size_t bytes = 0;
  SqliteCode code = SQLITE_DONE;
  for (int records = 0; records < kLooksPerPiece; ++records) {
    code = read_.step();
    if (code != SQLITE_ROW) break;
    const bool isReversed = filter_.order == RecordOrder::kNewestFirst;
    if (isReversed) {
      bounds_.last = read_.integer(kID) - 1;
    } else {
      bounds_.first = read_.integer(kID) + 1;
    }
    bool hasPayload = false;
    for (const int place : {0, 1}) {
      Event event{};
      if (!readEvent(read_, isReversed ? 1 - place : place, event)) continue;
      if (!hasPayload) {
        // Copy the payload once for both events of a record.
        piece.payloads.emplace_back(read_.text(kPayload));
        bytes += piece.payloads.back().size();
        hasPayload = true;
      }
      event.payload = piece.payloads.size() - 1;
      piece.events.push_back(event);
    }
    if (piece.events.size() >= kRecordsPerPiece || bytes >= kBytesPerPiece) break;
  }
  read_.reset();
  if (code == SQLITE_DONE) bounds_.first = bounds_.last + 1;
  return code == SQLITE_DONE || code == SQLITE_ROW ? SQLITE_OK : code;
}

bool EventScan::readEvent(const Statement& row, int which, Event& event) {
  const bool isTwin = which == 1;
  if (isTwin && row.isNull(kTwinNameID)) return false;
  event.id = 2 * row.integer(kID) + which;
  event.time = row.real(isTwin ? kTwinTime : kTime);
  event.nameID = row.integer(isTwin ? kTwinNameID : kNameID);
  return passes(event) &&
         (!filter_.acceptsEvent ||
          filter_.acceptsEvent({event.id, event.time, nameOf(event.nameID), row.text(kPayload)}));
}

bool EventScan::passes(const Event& event) {
  return event.id > after_ && (!filter_.before.has_value() || event.id < *filter_.before) &&
         isWithinTimes(filter_, event.time) && name(event.nameID).matches;
}

// Looks a name up at its first use and keeps it. There are few names, and reading all of them at
// the start would miss those that the service adds between two pieces. A name that cannot be read
// stays empty.
const EventScan::Name& EventScan::name(std::int64_t nameID) {
  const auto known = names_.find(nameID);
  if (known != names_.end()) return known->second;
  Name& added = names_[nameID];
  Statement statement;
  if (database_.prepare("SELECT name FROM event_names WHERE id = ?1", statement) == SQLITE_OK) {
    statement.bind(1, nameID);
    if (statement.step() == SQLITE_ROW) added.text = statement.text(0);
  }
  added.matches = matchesAny(filter_.names, added.text);
  return added;
}

}  // namespace halvox::platform::linux_
