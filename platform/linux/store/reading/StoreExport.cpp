#include "platform/linux/store/reading/StoreExport.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <fstream>
#include <span>
#include <string>
#include <string_view>
#include <system_error>
#include <utility>

#include "platform/linux/base/ErrnoText.h"

namespace halvox::platform::linux_ {
namespace {

// The names of the tables of an export, and the kinds of their records. null: the events.
constexpr std::array<std::pair<std::string_view, const RecordTable*>, 6> kKinds{
    {{"analytics_events", nullptr},
     {"issue_metrics", &kIssueMetrics},
     {"power_events", &kPowerEvents},
     {"link_messages", &kLinkMessages},
     {"snapshots", &kSnapshots},
     {"losses", &kLosses}}};

constexpr std::array kEventColumns{RecordColumn{"name", ColumnType::kText},
                                   RecordColumn{"payload", ColumnType::kText}};

std::span<const RecordColumn> columnsOf(const RecordTable* kind) {
  return kind == nullptr ? std::span<const RecordColumn>(kEventColumns) : kind->columns;
}

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

// SQLite stores NULL for a text with a null pointer, which an empty view may have.
std::string_view notNull(std::string_view text) { return text.empty() ? "" : text; }

// Binds the columns after the time.
void bindColumns(Statement& statement, const StoredItem& item) {
  if (item.table == nullptr) {
    statement.bind(2, notNull(item.name));
    statement.bind(3, notNull(item.payload));
  } else if (item.table == &kIssueMetrics) {
    statement.bind(2, item.number);
    statement.bind(3, std::as_bytes(std::span(item.payload)));
  } else if (item.table == &kPowerEvents) {
    statement.bind(2, item.number);
    statement.bind(3, notNull(item.name));
    statement.bind(4, notNull(item.payload));
  } else if (item.table == &kLinkMessages) {
    statement.bind(2, item.sessionID);
    statement.bind(3, notNull(item.clientName));
    statement.bind(4, notNull(item.serviceName));
    statement.bind(5, item.number);
    statement.bind(6, item.type);
    statement.bind(7, notNull(item.payload));
  } else if (item.table == &kLosses) {
    statement.bind(2, notNull(item.name));
    statement.bind(3, notNull(item.payload));
    statement.bind(4, item.number);
  } else {
    statement.bind(2, notNull(item.payload));
    statement.bind(3, notNull(item.path));
  }
}

}  // namespace

StoreExport::StoreExport(std::filesystem::path file)
    : file_(std::move(file)), part_(file_.native() + ".part") {}

StoreExport::~StoreExport() {
  tables_.clear();
  database_.close();
  std::error_code ignored;
  std::filesystem::remove(part_, ignored);
}

Result<void> StoreExport::create() {
  // Create an empty file, which SQLite opens as an empty database.
  if (!std::ofstream(part_, std::ios::trunc)) {
    return Failure<>{part_.native() + ": " + errnoText(errno)};
  }
  SqliteCode code = database_.open("file:" + part_.native(), DatabaseAccess::kReadWrite);
  // The file need not survive a crash, because a failed export is deleted.
  if (code == SQLITE_OK) {
    code = database_.execute("PRAGMA journal_mode = OFF; PRAGMA synchronous = OFF; BEGIN");
  }
  for (const auto& [name, kind] : kKinds) {
    if (code == SQLITE_OK) code = createTable(name, kind);
  }
  if (code != SQLITE_OK) return cannotWrite();
  return {};
}

SqliteCode StoreExport::createTable(std::string_view name, const RecordTable* kind) {
  std::string create = "CREATE TABLE " + std::string(name) + "(time REAL NOT NULL";
  std::string insert = "INSERT INTO " + std::string(name) + " VALUES (?";
  for (const RecordColumn& column : columnsOf(kind)) {
    create.append(", ").append(column.name).append(" ").append(typeName(column.type));
    create += " NOT NULL";
    insert += ", ?";
  }
  const SqliteCode code = database_.execute(create + ")");
  if (code != SQLITE_OK) return code;
  return database_.prepare(insert + ")", tables_.emplace_back(Table{.kind = kind}).insert);
}

Result<void> StoreExport::add(const StoredItem& item) {
  const auto table = std::ranges::find(tables_, item.table, &Table::kind);
  if (table == tables_.end()) return {};
  table->insert.bind(1, item.time);
  bindColumns(table->insert, item);
  if (table->insert.run() != SQLITE_OK) return cannotWrite();
  ++records_;
  return {};
}

Result<void> StoreExport::finish() {
  if (database_.execute("COMMIT") != SQLITE_OK) return cannotWrite();
  tables_.clear();
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
