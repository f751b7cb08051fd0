#include "platform/linux/store/reading/StoreExport.h"

#include <array>
#include <cerrno>
#include <cstddef>
#include <fstream>
#include <span>
#include <string>
#include <string_view>
#include <system_error>
#include <utility>

#include "platform/linux/base/ErrnoText.h"

namespace halvox::platform::linux_ {
namespace {

// The names of the other tables of an export, and the tables of the store from which their records
// come.
constexpr std::array<std::pair<std::string_view, const RecordTable*>, 4> kKinds{
    {{"issue_metrics", &kIssueMetrics},
     {"power_events", &kPowerEvents},
     {"link_messages", &kLinkMessages},
     {"snapshots", &kSnapshots}}};

std::string_view typeName(ColumnType type) {
  switch (type) {
    case ColumnType::kInteger:
      return "INTEGER";
    case ColumnType::kText:
      return "TEXT";
    case ColumnType::kBytes:
      return "BLOB";
  }
  return {};
}

std::string createTable(std::string_view name, const RecordTable& table) {
  std::string sql = "CREATE TABLE " + std::string(name) + "(time REAL NOT NULL";
  for (const RecordColumn& column : table.columns) {
    sql.append(", ").append(column.name).append(" ").append(typeName(column.type));
    sql += " NOT NULL";
  }
  return sql + ");";
}

}  // namespace

StoreExport::StoreExport(std::filesystem::path file)
    : file_(std::move(file)), part_(file_.native() + ".part") {}

StoreExport::~StoreExport() {
  database_.close();
  std::error_code ignored;
  std::filesystem::remove(part_, ignored);
}

Result<void> StoreExport::create() {
  // Create an empty file, which SQLite opens as an empty database.
  if (!std::ofstream(part_, std::ios::trunc)) {
    return Failure<>{part_.native() + ": " + errnoText(errno)};
  }
  std::string sql =
      // The file need not survive a crash, because a failed export is deleted.
      "PRAGMA journal_mode = OFF; PRAGMA synchronous = OFF; BEGIN;"
      "CREATE TABLE analytics_events(time REAL NOT NULL, name TEXT NOT NULL, payload TEXT NOT "
      "NULL);";
  for (const auto& [name, table] : kKinds) sql += createTable(name, *table);
  code_ = database_.open("file:" + part_.native(), DatabaseAccess::kReadWrite);
  if (code_ == SQLITE_OK) code_ = database_.execute(sql);
  if (code_ != SQLITE_OK) return cannotWrite();
  return {};
}

Result<void> StoreExport::copyFrom(StoreReader& reader, const RecordFilter& filter) {
  if (auto copied = copyEvents(reader, filter); !copied) return copied;
  for (const auto& [name, table] : kKinds) {
    if (auto copied = copyKind(name, *table, reader, filter); !copied) return copied;
  }
  return {};
}

void StoreExport::insert(Statement& statement) {
  code_ = statement.run();
  if (code_ == SQLITE_OK) ++records_;
}

Result<void> StoreExport::copyEvents(StoreReader& reader, const RecordFilter& filter) {
  Statement statement;
  code_ = database_.prepare("INSERT INTO analytics_events VALUES (?1, ?2, ?3)", statement);
  return outcome(reader.forEachEvent(filter, [&](const StoredEvent& event) {
    if (code_ != SQLITE_OK) return;
    statement.bind(1, event.time);
    statement.bind(2, event.name);
    statement.bind(3, event.payload);
    insert(statement);
  }));
}

Result<void> StoreExport::copyKind(std::string_view name, const RecordTable& table,
                                   StoreReader& reader, const RecordFilter& filter) {
  std::string sql = "INSERT INTO " + std::string(name) + " VALUES (?1";
  for (std::size_t column = 0; column < table.columns.size(); ++column) {
    sql += ", ?" + std::to_string(column + 2);
  }
  Statement statement;
  code_ = database_.prepare(sql + ")", statement);
  return outcome(reader.forEachRecord(table, filter, [&](const StoredRecord& record) {
    if (code_ != SQLITE_OK) return;
    statement.bind(1, record.time);
    for (std::size_t column = 0; column < table.columns.size(); ++column) {
      const int index = static_cast<int>(column) + 2;
      switch (table.columns[column].type) {
        case ColumnType::kInteger:
          statement.bind(index, record.number(column));
          break;
        case ColumnType::kText:
          statement.bind(index, std::string_view(record.text(column)));
          break;
        case ColumnType::kBytes:
          statement.bind(index, std::as_bytes(std::span(record.text(column))));
          break;
      }
    }
    insert(statement);
  }));
}

Result<void> StoreExport::outcome(const Result<void, StoreError>& read) const {
  if (code_ != SQLITE_OK) return cannotWrite();
  if (!read) return Failure<>{read.error().message};
  return {};
}

Result<void> StoreExport::finish() {
  code_ = database_.execute("COMMIT");
  if (code_ != SQLITE_OK) return cannotWrite();
  database_.close();
  std::error_code error;
  std::filesystem::rename(part_, file_, error);
  if (error) return Failure<>{file_.native() + ": " + error.message()};
  return {};
}

Failure<> StoreExport::cannotWrite() const {
  return {part_.native() + ": " + database_.errorText()};
}

}  // namespace halvox::platform::linux_
