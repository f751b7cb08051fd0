#include "platform/linux/store/spool/SpoolTable.h"

#include <algorithm>
#include <charconv>
#include <span>
#include <string_view>
#include <utility>
#include <vector>

#include "platform/linux/store/EraseSelection.h"
#include "platform/linux/store/spool/SpoolRow.h"

namespace halvox::platform::linux_ {
namespace {

// A link message as the selection sees it. The last part of a subject is the session's ID.
ErasableRecord erasable(const SpooledMessage& message) {
  ErasableRecord record{.kind = ErasableRecord::Kind::kLink};
  const std::string_view id =
      std::string_view(message.subject).substr(message.subject.rfind('.') + 1);
  static_cast<void>(std::from_chars(id.data(), id.data() + id.size(), record.sessionID));
  record.payload = message.body;
  return record;
}

// Looks at the messages, or empties those that are selected. Returns how many it has emptied.
std::uint64_t visit(std::vector<SpooledMessage>& messages, const ErasePass& pass) {
  std::uint64_t erased = 0;
  for (SpooledMessage& message : messages) {
    if (isErased(message)) continue;
    if (pass.isLooking) {
      pass.selection->look(erasable(message));
    } else if (pass.selection->selects(erasable(message))) {
      message = {};
      ++erased;
    }
  }
  return erased;
}

SqliteCode replace(Database& database, std::int64_t first,
                   const std::vector<SpooledMessage>& messages) {
  if (std::ranges::all_of(messages, isErased)) {
    Statement remove;
    const SqliteCode code = database.prepare("DELETE FROM link_spool WHERE first = ?1", remove);
    if (code != SQLITE_OK) return code;
    remove.bind(1, first);
    return remove.run();
  }
  SpoolRowWriter writer;
  for (const SpooledMessage& message : messages) writer.add(message);
  const std::optional<std::string_view> row = writer.finish();
  if (!row) return SQLITE_NOMEM;
  Statement update;
  const SqliteCode code =
      database.prepare("UPDATE link_spool SET block = ?2 WHERE first = ?1", update);
  if (code != SQLITE_OK) return code;
  update.bind(1, first);
  update.bind(2, std::as_bytes(std::span(row->data(), row->size())));
  return update.run();
}

}  // namespace

SqliteCode SpoolTable::erase(Database& database, ErasePass& pass, bool& more) {
  more = false;
  if (pass.last < 0) {
    pass.last = database.queryInteger("SELECT ifnull(max(first), 0) FROM link_spool").value_or(0);
  }
  Statement row;
  SqliteCode code = database.prepare(
      "SELECT first, messages, block FROM link_spool WHERE first BETWEEN ?1 AND ?2"
      " ORDER BY first LIMIT 1",
      row);
  if (code != SQLITE_OK) return code;
  row.bind(1, pass.next);
  row.bind(2, pass.last);
  code = row.step();
  if (code != SQLITE_ROW) return code == SQLITE_DONE ? SQLITE_OK : code;
  more = true;
  const std::int64_t first = row.integer(0);
  pass.next = first + 1;
  auto messages = readSpoolRow(row.bytes(2), static_cast<std::size_t>(row.integer(1)));
  row.reset();
  // What cannot be read is of no use to anybody. Erase it: it may hold what was asked for.
  if (!messages && !pass.isLooking) messages.emplace();
  if (!messages) return SQLITE_OK;
  const std::uint64_t erased = visit(*messages, pass);
  pass.erased += erased;
  if (erased == 0 && !messages->empty()) return SQLITE_OK;
  return replace(database, first, *messages);
}

SqliteCode SpoolTable::prepare(Database& database) {
  const SqliteCode code = database.prepare(
      "SELECT first, messages - sent, time FROM link_spool ORDER BY first LIMIT 1", oldest_);
  if (code != SQLITE_OK) return code;
  return database.prepare("DELETE FROM link_spool WHERE first = ?1", remove_);
}

void SpoolTable::release() {
  oldest_ = {};
  remove_ = {};
}

SqliteCode SpoolTable::readOldest(std::optional<Row>& row) {
  row.reset();
  const SqliteCode code = oldest_.step();
  if (code == SQLITE_ROW) {
    row = Row{.first = oldest_.integer(0),
              .unsent = static_cast<std::uint64_t>(std::max<std::int64_t>(oldest_.integer(1), 0)),
              .time = oldest_.real(2)};
  }
  oldest_.reset();
  return code == SQLITE_ROW || code == SQLITE_DONE ? SQLITE_OK : code;
}

SqliteCode SpoolTable::remove(const Row& row) {
  remove_.bind(1, row.first);
  return remove_.run();
}

SqliteCode StoredSpool::oldestTime(std::optional<double>& time) {
  std::optional<SpoolTable::Row> row;
  const SqliteCode code = table_.readOldest(row);
  time = row ? std::optional(row->time) : std::nullopt;
  return code;
}

SqliteCode StoredSpool::deleteOldest(bool& found) {
  std::optional<SpoolTable::Row> row;
  const SqliteCode code = table_.readOldest(row);
  found = row.has_value();
  return code == SQLITE_OK && row ? table_.remove(*row) : code;
}

SqliteCode StoredSpool::deleteOlderThan(double time, bool& found) {
  std::optional<SpoolTable::Row> row;
  const SqliteCode code = table_.readOldest(row);
  found = row && row->time < time;
  return code == SQLITE_OK && found ? table_.remove(*row) : code;
}

}  // namespace halvox::platform::linux_
