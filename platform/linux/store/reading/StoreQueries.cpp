#include "platform/linux/store/reading/StoreQueries.h"

#include <algorithm>
#include <array>
#include <string_view>

#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/store/blocks/MessageTables.h"

namespace halvox::platform::linux_ {
namespace {

constexpr const char* kOnlyReading =
    "only SELECT is allowed, and PRAGMA table_info, table_xinfo and table_list";

constexpr std::array<std::string_view, 3> kPragmas{"table_info", "table_xinfo", "table_list"};

// SQLite calls this function while it compiles a statement, to learn what the statement may do.
// Everything that is not listed is denied, such as attaching other files, transactions that would
// outlive the statement, and all changes.
int authorize(void* /*context*/, int action, const char* first, const char* /*second*/,
              const char* /*schema*/, const char* /*trigger*/) {
  switch (action) {
    case SQLITE_SELECT:
    case SQLITE_READ:
    case SQLITE_FUNCTION:
    case SQLITE_RECURSIVE:
      return SQLITE_OK;
    case SQLITE_PRAGMA:
      return std::ranges::find(kPragmas, std::string_view(first)) != kPragmas.end() ? SQLITE_OK
                                                                                    : SQLITE_DENY;
    default:
      return SQLITE_DENY;
  }
}

StoreQueries::Value valueOf(sqlite3_stmt* statement, int column) {
  switch (sqlite3_column_type(statement, column)) {
    case SQLITE_INTEGER:
      return std::int64_t{sqlite3_column_int64(statement, column)};
    case SQLITE_FLOAT:
      return sqlite3_column_double(statement, column);
    case SQLITE_TEXT: {
      const auto* const text =
          reinterpret_cast<const char*>(sqlite3_column_text(statement, column));
      return std::string_view(text,
                              static_cast<std::size_t>(sqlite3_column_bytes(statement, column)));
    }
    case SQLITE_BLOB: {
      const auto* const bytes =
          static_cast<const std::byte*>(sqlite3_column_blob(statement, column));
      return std::span(bytes, static_cast<std::size_t>(sqlite3_column_bytes(statement, column)));
    }
    default:
      return std::monostate();
  }
}

}  // namespace

Result<void, StoreError> StoreQueries::open(const std::filesystem::path& directory) {
  if (auto opened = reader_.open(directory); !opened) return opened;
  Database& database = reader_.database();
  // The first statement that uses the tables makes them, which the authorizer would deny. Make them
  // before it is set.
  Statement tables;
  if (addMessageTables(database.get()) != SQLITE_OK ||
      database.prepare("SELECT 1 FROM halvox_events, halvox_links", tables) != SQLITE_OK) {
    return Failure<StoreError>{StoreError::kCannotOpen, database.errorText()};
  }
  // Those of JSON too. An SQLite without them says so when a query names one.
  static_cast<void>(
      database.prepare("SELECT 1 FROM json_each('[]') AS one, json_tree('[]') AS two", tables));
  sqlite3_set_authorizer(database.get(), authorize, nullptr);
  return {};
}

Result<void> StoreQueries::runFirst(std::string_view& sql, const ColumnsCallback& columns,
                                    const RowCallback& row) {
  Database& database = reader_.database();
  UniqueHandle<sqlite3_stmt*, sqlite3_finalize> statement;
  const char* rest = nullptr;
  const SqliteCode prepared = sqlite3_prepare_v2(
      database.get(), sql.data(), static_cast<int>(sql.size()), statement.out(), &rest);
  if (prepared == SQLITE_AUTH) return Failure<>{kOnlyReading};
  if (prepared != SQLITE_OK) return Failure<>{database.errorText()};
  sql.remove_prefix(static_cast<std::size_t>(rest - sql.data()));
  if (!statement) return {};
  const int count = sqlite3_column_count(statement.get());
  std::vector<std::string> names;
  names.reserve(static_cast<std::size_t>(count));
  for (int column = 0; column < count; ++column) {
    names.emplace_back(sqlite3_column_name(statement.get(), column));
  }
  columns(names);
  std::vector<Value> values;
  SqliteCode code = SQLITE_ROW;
  while ((code = sqlite3_step(statement.get())) == SQLITE_ROW) {
    values.clear();
    for (int column = 0; column < count; ++column) {
      values.push_back(valueOf(statement.get(), column));
    }
    row(values);
  }
  // SQLite asks the authorizer about VACUUM only when it runs.
  if (code == SQLITE_AUTH) return Failure<>{kOnlyReading};
  if (code != SQLITE_DONE) return Failure<>{database.errorText()};
  return {};
}

bool StoreQueries::isComplete(const std::string& sql) { return sqlite3_complete(sql.c_str()) != 0; }

}  // namespace halvox::platform::linux_
