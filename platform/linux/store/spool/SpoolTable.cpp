#include "platform/linux/store/spool/SpoolTable.h"

#include <algorithm>

namespace halvox::platform::linux_ {

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
