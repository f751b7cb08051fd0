#include "platform/linux/store/reading/verify/StoreVerifier.h"

#include <array>
#include <string_view>
#include <utility>

#include "platform/linux/store/StoreOpening.h"
#include "platform/linux/store/StoreSchema.h"
#include "platform/linux/store/reading/verify/BlockVerifier.h"
#include "platform/linux/store/reading/verify/LogVerifier.h"
#include "platform/linux/store/reading/verify/RowVerifier.h"
#include "platform/linux/store/reading/verify/SchemaVerifier.h"
#include "platform/linux/store/reading/verify/SpoolVerifier.h"

namespace halvox::platform::linux_ {
namespace {

// The first schema version with run_records.
constexpr std::int64_t kRunsSinceVersion = 5;
// The first schema version with link_spool.
constexpr std::int64_t kSpoolSinceVersion = 6;

struct RowsOfVersion {
  VerifiedRows rows;
  std::int64_t sinceVersion;
};
constexpr std::array<RowsOfVersion, 6> kRows{{
    {{"analytics_records", "analytics_spans", "payload"}, 1},
    {{"issue_metric_records", "issue_metric_spans", ""}, 2},
    {{"power_event_records", "power_event_spans", "payload"}, 2},
    {{"link_message_records", "link_message_spans", "payload"}, 2},
    {{"snapshot_records", "snapshot_spans", "signature"}, 2},
    {{"loss_records", "loss_spans", ""}, 4},
}};

// Calls `add` with each line of a text, without the headings of SQLite's report.
template <typename Add>
void forEachLine(std::string_view text, Add add) {
  while (!text.empty()) {
    const std::size_t end = text.find('\n');
    const std::string_view line = text.substr(0, end);
    text.remove_prefix(end == std::string_view::npos ? text.size() : end + 1);
    if (!line.empty() && !line.starts_with("***")) add(std::string(line));
  }
}

}  // namespace

Result<VerifiedStore, StoreError> StoreVerifier::verify(const std::filesystem::path& directory) {
  const std::filesystem::path path = directory / kStoreFileName;
  file_ = path.native();
  // Opening the database makes a new index of the log, in which a truncated log looks complete.
  verifyLog(path, differences_);
  VerifiedStore store;
  if (auto opened = reader_.open(directory); !opened) {
    if (opened.error().code != StoreError::kDamaged) return std::move(opened).error();
    differences_.add(file_, "", opened.error().message);
    return store;
  }
  Database& database = reader_.database();
  SqliteCode code = database.execute("BEGIN");
  if (code == SQLITE_OK) code = verifySnapshot(store);
  if (code != SQLITE_OK) {
    const std::string why = database.errorText();
    if (!meansDamage(code)) {
      return Failure<StoreError>{StoreError::kCannotOpen,
                                 file_ + ": cannot read the database: " + why};
    }
    differences_.add(file_, "", "the database is damaged: " + why);
  }
  static_cast<void>(database.execute("ROLLBACK"));
  return store;
}

SqliteCode StoreVerifier::verifySnapshot(VerifiedStore& store) {
  Database& database = reader_.database();
  const auto version = database.queryInteger("PRAGMA user_version");
  if (!version.has_value()) return sqlite3_extended_errcode(database.get());
  store.version = *version;
  bool hasTables = false;
  SqliteCode code = verifyPages();
  if (code == SQLITE_OK) code = verifySchema(database, store.version, differences_, hasTables);
  if (code != SQLITE_OK || !hasTables) return code;
  code = verifyRecords(store);
  if (code == SQLITE_OK && store.version >= kRunsSinceVersion) code = verifyRuns();
  if (code == SQLITE_OK && store.version >= kSpoolSinceVersion) {
    code = verifySpool(database, differences_, store.records);
  }
  if (code == SQLITE_OK && store.version >= kRows[1].sinceVersion) code = readCaptures(store);
  return code;
}

SqliteCode StoreVerifier::verifyPages() {
  Database& database = reader_.database();
  Statement check;
  SqliteCode code = database.prepare("PRAGMA integrity_check", check);
  while (code == SQLITE_OK || code == SQLITE_ROW) {
    code = check.step();
    if (code != SQLITE_ROW || check.text(0) == "ok") continue;
    forEachLine(check.text(0), [this](const std::string& line) {
      differences_.add(file_, line, "SQLite's check of the pages found this");
    });
  }
  return code == SQLITE_DONE ? SQLITE_OK : code;
}

SqliteCode StoreVerifier::verifyRecords(VerifiedStore& store) {
  Database& database = reader_.database();
  SqliteCode code = verifyEventNames(database, differences_);
  for (const RowsOfVersion& kind : kRows) {
    if (code != SQLITE_OK || store.version < kind.sinceVersion) continue;
    code = verifyRows(database, kind.rows, differences_, store.records);
  }
  if (code != SQLITE_OK || store.version < kBlocksSinceVersion) return code;
  BlockVerifier blocks(database, differences_);
  code = blocks.run();
  store.records += blocks.records();
  return code;
}

// Only the newest run may last, or have been killed. The run after it writes how it ended.
SqliteCode StoreVerifier::verifyRuns() {
  Statement runs;
  SqliteCode code = reader_.database().prepare(
      "SELECT id FROM run_records WHERE"
      " (ending IS NULL AND id < (SELECT max(id) FROM run_records))"
      " OR ending NOT IN ('clean', 'crash', 'power cut', 'unknown')",
      runs);
  while (code == SQLITE_OK || code == SQLITE_ROW) {
    code = runs.step();
    if (code != SQLITE_ROW) continue;
    differences_.add("run_records", rowPlace(runs.integer(0)), "does not say how the run ended");
  }
  return code == SQLITE_DONE ? SQLITE_OK : code;
}

SqliteCode StoreVerifier::readCaptures(VerifiedStore& store) {
  Statement captures;
  SqliteCode code =
      reader_.database().prepare("SELECT path FROM snapshot_records ORDER BY id", captures);
  while (code == SQLITE_OK || code == SQLITE_ROW) {
    code = captures.step();
    if (code == SQLITE_ROW) store.captures.emplace_back(captures.text(0));
  }
  return code == SQLITE_DONE ? SQLITE_OK : code;
}

}  // namespace halvox::platform::linux_
