#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include <sqlite3.h>

#include "platform/linux/UniqueHandle.h"

namespace halvox::platform::linux_ {

// A result code of SQLite, extended ones included; SQLITE_OK is 0.
using SqliteCode = int;

// A prepared statement. Belongs to the thread of its database and must go before it does.
class Statement {
 public:
  Statement() = default;

  // Texts and bytes are not copied: what was bound must live until the statement has run.
  void bind(int index, std::int64_t number) { sqlite3_bind_int64(handle_.get(), index, number); }
  void bind(int index, double number) { sqlite3_bind_double(handle_.get(), index, number); }
  void bind(int index, std::string_view text) {
    sqlite3_bind_text64(handle_.get(), index, text.data(), text.size(), SQLITE_STATIC, SQLITE_UTF8);
  }
  void bind(int index, std::span<const std::byte> bytes) {
    // Without an address the library would take no bytes for no value.
    const void* data = bytes.empty() ? "" : static_cast<const void*>(bytes.data());
    sqlite3_bind_blob64(handle_.get(), index, data, bytes.size(), SQLITE_STATIC);
  }
  void bindNull(int index) { sqlite3_bind_null(handle_.get(), index); }

  // SQLITE_ROW, SQLITE_DONE or an error.
  [[nodiscard]] SqliteCode step() { return sqlite3_step(handle_.get()); }
  void reset() { sqlite3_reset(handle_.get()); }
  // Runs a statement whose rows, if any, do not matter: SQLITE_OK or an error.
  [[nodiscard]] SqliteCode run();

  // Columns of the current row; texts are valid until the next step or reset.
  [[nodiscard]] bool isNull(int column) const {
    return sqlite3_column_type(handle_.get(), column) == SQLITE_NULL;
  }
  [[nodiscard]] std::int64_t integer(int column) const {
    return sqlite3_column_int64(handle_.get(), column);
  }
  [[nodiscard]] double real(int column) const {
    return sqlite3_column_double(handle_.get(), column);
  }
  [[nodiscard]] std::string_view text(int column) const;
  [[nodiscard]] std::string_view bytes(int column) const;
  [[nodiscard]] int columns() const { return sqlite3_column_count(handle_.get()); }

 private:
  friend class Database;
  UniqueHandle<sqlite3_stmt*, sqlite3_finalize> handle_;
};

enum class DatabaseAccess : std::uint8_t { kReadWrite, kReadOnly };

// One connection to a database file. Belongs to one thread at a time.
class Database {
 public:
  // Opens an existing file, named by path or by a "file:" URI. Reads nothing of it yet.
  [[nodiscard]] SqliteCode open(const std::string& file, DatabaseAccess access);
  // Closes the connection; its statements must be gone.
  void close() { handle_.reset(); }
  [[nodiscard]] bool isOpen() const { return static_cast<bool>(handle_); }

  [[nodiscard]] SqliteCode prepare(std::string_view sql, Statement& statement);
  // Runs one or several statements; rows do not matter.
  [[nodiscard]] SqliteCode execute(const std::string& sql);
  // The first column of the first row; none on an error or when there is no row.
  [[nodiscard]] std::optional<std::int64_t> queryInteger(std::string_view sql);

  // The last error in words, with the system's own when there was one.
  [[nodiscard]] std::string errorText() const;
  [[nodiscard]] int systemError() const { return sqlite3_system_errno(handle_.get()); }
  [[nodiscard]] sqlite3* get() const { return handle_.get(); }

 private:
  UniqueHandle<sqlite3*, sqlite3_close> handle_;
};

}  // namespace halvox::platform::linux_
