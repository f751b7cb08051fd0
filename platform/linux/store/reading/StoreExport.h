#pragma once

#include <cstdint>
#include <filesystem>

#include "platform/linux/base/Result.h"
#include "platform/linux/store/Sqlite.h"
#include "platform/linux/store/reading/StoreReader.h"

namespace halvox::platform::linux_ {

// Writes a database in which the five views of a store are plain tables with the same columns. Any
// program that can read SQLite can read this database without the store's extension.
//
//   create(); copyFrom(); finish()
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
  // Copies the records of all kinds that pass the filter. A service may write to the store at the
  // same time. The error says why the store cannot be read or the file cannot be written.
  Result<void> copyFrom(StoreReader& reader, const RecordFilter& filter);
  // Commits, and gives the file its final name. Replaces an existing file of that name.
  Result<void> finish();

  [[nodiscard]] std::uint64_t records() const { return records_; }

 private:
  Result<void> copyEvents(StoreReader& reader, const RecordFilter& filter);
  Result<void> copyKind(std::string_view name, const RecordTable& table, StoreReader& reader,
                        const RecordFilter& filter);
  void insert(Statement& statement);
  // Returns the error of reading a kind or of writing its rows, or success.
  [[nodiscard]] Result<void> outcome(const Result<void, StoreError>& read) const;
  [[nodiscard]] Failure<> cannotWrite() const;

  const std::filesystem::path file_;
  const std::filesystem::path part_;
  Database database_;
  SqliteCode code_ = SQLITE_OK;  // the first error of writing
  std::uint64_t records_ = 0;
};

}  // namespace halvox::platform::linux_
