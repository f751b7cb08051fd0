#include "platform/linux/store/reading/verify/RowVerifier.h"

#include <string>

#include "platform/linux/store/StoreOpening.h"
#include "platform/linux/store/StoreSchema.h"
#include "platform/linux/store/reading/verify/JsonCheck.h"

namespace halvox::platform::linux_ {
namespace {

SqliteCode judged(SqliteCode code, Database& database, const std::string& table, std::int64_t after,
                  Differences& differences) {
  if (code == SQLITE_DONE) return SQLITE_OK;
  if (!meansDamage(code)) return code;
  differences.add(table, "after " + rowPlace(after), "cannot be read: " + database.errorText());
  return SQLITE_OK;
}

// The columns of the statement that joins records and spans.
enum Column : int { kID, kTime, kSpan, kFirstTime, kLastTime, kPayload };

void verifyRow(const Statement& row, const VerifiedRows& rows, Differences& differences) {
  const std::string table(rows.records);
  const std::string place = rowPlace(row.integer(kID));
  if (row.isNull(kSpan)) {
    differences.add(table, place, "has no row in " + std::string(rows.spans));
  } else if (row.real(kTime) < row.real(kFirstTime) || row.real(kTime) > row.real(kLastTime)) {
    differences.add(table, place,
                    "has a time that is not within that of its row in " + std::string(rows.spans));
  }
  if (!rows.payload.empty() && !isJsonObject(row.text(kPayload))) {
    differences.add(table, place, "has a payload that is not a JSON object");
  }
}

}  // namespace

SqliteCode verifyRows(Database& database, const VerifiedRows& rows, Differences& differences,
                      std::uint64_t& count) {
  const std::string table(rows.records);
  const std::string payload = rows.payload.empty() ? "NULL" : "record." + std::string(rows.payload);
  Statement statement;
  SqliteCode code = database.prepare(
      "SELECT record.id, record.time, span.span, span.first_time, span.last_time, " + payload +
          " FROM " + table + " AS record LEFT JOIN " + std::string(rows.spans) +
          " AS span ON span.span = record.id / " + std::to_string(kRecordsPerSpan) +
          " ORDER BY record.id",
      statement);
  std::int64_t last = 0;
  while (code == SQLITE_OK || code == SQLITE_ROW) {
    code = statement.step();
    if (code != SQLITE_ROW) break;
    last = statement.integer(kID);
    ++count;
    verifyRow(statement, rows, differences);
  }
  return judged(code, database, table, last, differences);
}

SqliteCode verifyEventNames(Database& database, Differences& differences) {
  const std::string table = "analytics_records";
  Statement statement;
  SqliteCode code = database.prepare(
      "SELECT id FROM analytics_records WHERE name_id NOT IN (SELECT id FROM event_names)"
      " OR (twin_name_id IS NOT NULL AND twin_name_id NOT IN (SELECT id FROM event_names))",
      statement);
  std::int64_t last = 0;
  while (code == SQLITE_OK || code == SQLITE_ROW) {
    code = statement.step();
    if (code != SQLITE_ROW) break;
    last = statement.integer(0);
    differences.add(table, rowPlace(last), "has a name that is not in event_names");
  }
  return judged(code, database, table, last, differences);
}

}  // namespace halvox::platform::linux_
