#include "platform/linux/store/Sqlite.h"

#include "platform/linux/base/ErrnoText.h"

namespace halvox::platform::linux_ {

SqliteCode Statement::run() {
  SqliteCode code = step();
  while (code == SQLITE_ROW) code = step();
  reset();
  return code == SQLITE_DONE ? SQLITE_OK : code;
}

std::string_view Statement::text(int column) const {
  const unsigned char* text = sqlite3_column_text(handle_.get(), column);
  if (text == nullptr) return {};
  return {reinterpret_cast<const char*>(text),
          static_cast<std::size_t>(sqlite3_column_bytes(handle_.get(), column))};
}

std::string_view Statement::bytes(int column) const {
  const void* bytes = sqlite3_column_blob(handle_.get(), column);
  if (bytes == nullptr) return {};
  return {static_cast<const char*>(bytes),
          static_cast<std::size_t>(sqlite3_column_bytes(handle_.get(), column))};
}

SqliteCode Database::open(const std::string& file, DatabaseAccess access) {
  // SQLITE_OPEN_CREATE is missing because StoreFiles creates the file, with the right mode. With
  // NOMUTEX, SQLite does not lock the connection, which belongs to one thread at a time.
  const int mode =
      access == DatabaseAccess::kReadOnly ? SQLITE_OPEN_READONLY : SQLITE_OPEN_READWRITE;
  const SqliteCode code = sqlite3_open_v2(file.c_str(), handle_.out(),
                                          mode | SQLITE_OPEN_URI | SQLITE_OPEN_NOMUTEX, nullptr);
  if (code == SQLITE_OK) sqlite3_extended_result_codes(handle_.get(), 1);
  return code;
}

SqliteCode Database::prepare(std::string_view sql, Statement& statement) {
  return sqlite3_prepare_v3(handle_.get(), sql.data(), static_cast<int>(sql.size()),
                            SQLITE_PREPARE_PERSISTENT, statement.handle_.out(), nullptr);
}

SqliteCode Database::execute(const std::string& sql) {
  return sqlite3_exec(handle_.get(), sql.c_str(), nullptr, nullptr, nullptr);
}

std::optional<std::int64_t> Database::queryInteger(std::string_view sql) {
  Statement statement;
  if (prepare(sql, statement) != SQLITE_OK || statement.step() != SQLITE_ROW) return std::nullopt;
  return statement.integer(0);
}

std::string Database::errorText() const {
  std::string text = sqlite3_errmsg(handle_.get());
  const int error = systemError();
  if (error != 0) text += " (" + errnoText(error) + ")";
  return text;
}

}  // namespace halvox::platform::linux_
