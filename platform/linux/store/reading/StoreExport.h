#pragma once

#include <cstdint>
#include <filesystem>
#include <string_view>
#include <vector>

#include "platform/linux/base/Result.h"
#include "platform/linux/store/Sqlite.h"
#include "platform/linux/store/reading/StoreReader.h"

namespace halvox::platform::linux_ {

// Writes a database in which the six views of a store are plain tables with the same columns. Any
// program that can read SQLite can read this database without the store's extension.
//
//   create(); add() each record; finish()
//
// Belongs to one thread and one owner. Until finish() has succeeded, the content is in a file
// `FILE.part`, which the destructor deletes.
class StoreExport {
 public:
  explicit StoreExport(std::filesystem::path file);
  StoreExport(const StoreExport&) = delete;
  StoreExport& operator=(const StoreExport&) = delete;
  ~StoreExport();

  Result<void> create();
  // Adds a record to the table of its kind.
  Result<void> add(const StoredItem& item);
  // Commits, and gives the file its final name. Replaces an existing file of that name.
  Result<void> finish();

  [[nodiscard]] std::uint64_t records() const { return records_; }

 private:
  // A table, and the statement that adds a row to it.
  struct Table {
    const RecordTable* kind = nullptr;  // null: the events
    Statement insert{};
  };
  [[nodiscard]] SqliteCode createTable(std::string_view name, const RecordTable* kind);
  [[nodiscard]] Failure<> cannotWrite() const;

  const std::filesystem::path file_;
  const std::filesystem::path part_;
  Database database_;
  std::vector<Table> tables_;
  std::uint64_t records_ = 0;
};

}  // namespace halvox::platform::linux_
