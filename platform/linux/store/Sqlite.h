#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>

#include <sqlite3.h>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {

// A result code of SQLite: SQLITE_OK (0), or a primary or extended error code.
using SqliteCode = int;

// One prepared statement. The destructor finalizes it. Use it only on the thread of its Database,
// and destroy it before the Database is closed. Errors are returned as codes; Database::errorText()
// describes the last error.
class Statement {
 public:
  Statement() = default;

  // Parameter indices begin at 1. Texts and bytes are not copied. The caller must keep them alive
  // until the statement has run.
  void bind(int index, std::int64_t number) { sqlite3_bind_int64(handle_.get(), index, number); }
  void bind(int index, double number) { sqlite3_bind_double(handle_.get(), index, number); }
  void bind(int index, std::string_view text) {
    sqlite3_bind_text64(handle_.get(), index, text.data(), text.size(), SQLITE_STATIC, SQLITE_UTF8);
  }
  void bind(int index, std::span<const std::byte> bytes) {
    // For a null pointer, SQLite would store NULL instead of an empty blob, and an empty span may
    // have a null pointer.
    const void* data = bytes.empty() ? "" : static_cast<const void*>(bytes.data());
    sqlite3_bind_blob64(handle_.get(), index, data, bytes.size(), SQLITE_STATIC);
  }
  void bindNull(int index) { sqlite3_bind_null(handle_.get(), index); }

  // Returns SQLITE_ROW, SQLITE_DONE or an error code.
  [[nodiscard]] SqliteCode step() { return sqlite3_step(handle_.get()); }
  // Makes the statement ready to run again and ends its read of the database.
  void reset() { sqlite3_reset(handle_.get()); }
  // Runs the statement to its end, discards its rows and resets it. Returns SQLITE_OK or an error.
  [[nodiscard]] SqliteCode run();

  // The columns of the current row, counted from 0. Texts and bytes are valid until the next step
  // or reset.
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
  [[nodiscard]] std::string_view columnName(int column) const {
    return sqlite3_column_name(handle_.get(), column);
  }
  [[nodiscard]] int columns() const { return sqlite3_column_count(handle_.get()); }

 private:
  friend class Database;
  UniqueHandle<sqlite3_stmt*, sqlite3_finalize> handle_;
};

enum class DatabaseAccess : std::uint8_t { kReadWrite, kReadOnly };

// One connection to a database file. The destructor closes it. Only one thread at a time may use a
// connection, because SQLite's own locking of connections is disabled. Calls block on the disk, and
// on locks of other connections for as long as sqlite3_busy_timeout() allows.
class Database {
 public:
  // Opens an existing file, named by a path or a "file:" URI; never creates a file. SQLite reads
  // the file only when the first statement runs, and reports damage only then.
  [[nodiscard]] SqliteCode open(const std::string& file, DatabaseAccess access);
  // Closes the connection. All its statements must be destroyed already.
  void close() { handle_.reset(); }
  [[nodiscard]] bool isOpen() const { return static_cast<bool>(handle_); }

  [[nodiscard]] SqliteCode prepare(std::string_view sql, Statement& statement);
  // Runs one or more statements and discards their rows.
  [[nodiscard]] SqliteCode execute(const std::string& sql);
  // Returns the first column of the first row; std::nullopt on an error or without a row.
  [[nodiscard]] std::optional<std::int64_t> queryInteger(std::string_view sql);

  // Describes the last error: SQLite's text and, if there was one, the system's in parentheses.
  [[nodiscard]] std::string errorText() const;
  // The errno of the system call that caused the last error; 0 if none did.
  [[nodiscard]] int systemError() const { return sqlite3_system_errno(handle_.get()); }
  // Returns true if the last call failed. If it did not, errorText() is "not an error".
  [[nodiscard]] bool hasError() const {
    const int code = sqlite3_errcode(handle_.get()) & 0xFF;
    return code != SQLITE_OK && code != SQLITE_ROW && code != SQLITE_DONE;
  }
  [[nodiscard]] sqlite3* get() const { return handle_.get(); }

 private:
  UniqueHandle<sqlite3*, sqlite3_close> handle_;
};

}  // namespace halvox::platform::linux_
