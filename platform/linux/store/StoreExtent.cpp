#include "platform/linux/store/StoreExtent.h"

namespace halvox::platform::linux_ {
namespace {

// While this object exists, a second file is attached to the connection under the name `damaged`.
class AttachedFile {
 public:
  AttachedFile(Database& database, const std::string& file) : database_(database) {
    Statement attach;
    code_ = database.prepare("ATTACH ?1 AS damaged", attach);
    if (code_ != SQLITE_OK) return;
    attach.bind(1, std::string_view(file));
    code_ = attach.run();
  }
  AttachedFile(const AttachedFile&) = delete;
  AttachedFile& operator=(const AttachedFile&) = delete;
  ~AttachedFile() {
    if (code_ == SQLITE_OK) static_cast<void>(database_.execute("DETACH damaged"));
  }
  [[nodiscard]] SqliteCode code() const { return code_; }

 private:
  Database& database_;
  SqliteCode code_ = SQLITE_OK;
};

// Copies one kind in one transaction. Its records and spans therefore agree even after a failure.
SqliteCode copyKind(const KindTables& tables, std::int64_t newest, Database& database) {
  const std::string records(tables.records);
  const std::string spans(tables.spans);
  const SqliteCode code = database.execute(
      "BEGIN IMMEDIATE;"
      "INSERT INTO main." +
      records + " SELECT * FROM damaged." + records + " WHERE id > " + std::to_string(newest) +
      ";"
      // The first of these spans may also cover records that are not copied. It may therefore cover
      // more time than the copied records, which is harmless: readers use spans only to skip
      // records.
      "INSERT INTO main." +
      spans + " SELECT * FROM damaged." + spans +
      " WHERE span >= " + std::to_string((newest + 1) / tables.recordsPerSpan) +
      ";"
      "COMMIT");
  if (code != SQLITE_OK) static_cast<void>(database.execute("ROLLBACK"));
  return code;
}

}  // namespace

SqliteCode StoreExtent::read(Database& database, StoreExtent& extent) {
  for (std::size_t kind = 0; kind < kKindTables.size(); ++kind) {
    Statement statement;
    SqliteCode code = database.prepare(
        "SELECT ifnull((SELECT " + std::string(kKindTables[kind].newest) + " FROM " +
            std::string(kKindTables[kind].records) + " ORDER BY id DESC LIMIT 1), 0)",
        statement);
    if (code == SQLITE_OK) code = statement.step();
    if (code != SQLITE_ROW) return code;
    extent.newest[kind] = statement.integer(0);
  }
  return SQLITE_OK;
}

std::uint64_t copyRecordsAfter(const StoreExtent& extent, const std::string& file,
                               Database& database, std::string& problem) {
  problem.clear();
  const auto note = [&](std::string_view what) {
    if (!problem.empty()) problem += "; ";
    problem += std::string(what) + ": " + database.errorText();
  };
  const AttachedFile attached(database, file);
  if (attached.code() != SQLITE_OK) {
    note(file);
    return 0;
  }
  // Copy all names with their numbers, because records refer to names by number.
  if (database.execute("INSERT INTO main.event_names SELECT * FROM damaged.event_names") !=
      SQLITE_OK) {
    note("event_names");
  }
  std::uint64_t copied = 0;
  for (std::size_t kind = 0; kind < kKindTables.size(); ++kind) {
    const KindTables& tables = kKindTables[kind];
    if (copyKind(tables, extent.newest[kind], database) != SQLITE_OK) {
      note(tables.records);
      continue;
    }
    // All records in the new database are copies, because it was empty.
    const auto count = database.queryInteger("SELECT " + std::string(tables.count) + " FROM main." +
                                             std::string(tables.records));
    copied += static_cast<std::uint64_t>(count.value_or(0));
  }
  return copied;
}

}  // namespace halvox::platform::linux_
