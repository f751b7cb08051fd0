#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "platform/linux/store/RecordTables.h"
#include "platform/linux/store/Sqlite.h"
#include "platform/linux/store/StoreError.h"
#include "platform/linux/store/StoreFiles.h"

namespace halvox::platform::linux_ {

// The place of a record in the order in which those of its kind were stored. Numbers only grow,
// with gaps.
using StoredRecordID = std::int64_t;

// Only records in whose column stands one of the numbers.
struct NumberMatch {
  std::size_t column;  // of the kind's RecordTable
  std::vector<std::int64_t> numbers;
};

// Which records to read; what is not set does not restrict.
struct RecordFilter {
  // Glob patterns as fnmatch(3) understands them, of which one must match, for the kinds that have
  // a name.
  std::vector<std::string> names{};
  std::optional<double> since{};          // seconds since 1970, included
  std::optional<double> until{};          // seconds since 1970, not included
  StoredRecordID after = 0;               // only records stored later than this one
  std::optional<std::uint64_t> newest{};  // only so many, the newest
  std::vector<NumberMatch> numbers{};     // for the kinds that have a RecordTable
};

// An event as it is stored. The views are valid during the callback.
struct StoredEvent {
  StoredRecordID id;
  double time;  // seconds since 1970
  std::string_view name;
  std::string_view payload;  // JSON text
};

// A record of another kind: what stands in the columns of its RecordTable, in their order.
struct StoredRecord {
  using Field = std::variant<std::int64_t, std::string>;
  StoredRecordID id;
  double time;  // seconds since 1970
  std::vector<Field> fields;

  [[nodiscard]] std::int64_t number(std::size_t column) const {
    return std::get<std::int64_t>(fields[column]);
  }
  [[nodiscard]] const std::string& text(std::size_t column) const {
    return std::get<std::string>(fields[column]);
  }
};

// Reads a store, while a service writes to it or when none runs, and never changes it.
// Belongs to one thread. Holds no lock and no snapshot while a callback runs, so a slow reader does
// not keep the service from tidying up its files.
class StoreReader {
 public:
  using EventCallback = std::function<void(const StoredEvent&)>;
  using RecordCallback = std::function<void(const StoredRecord&)>;

  // Opens the store in that directory: kMissing when there is none, kDamaged, kNewerVersion or
  // kCannotOpen. May be called again, after an error or for another directory.
  [[nodiscard]] std::optional<StoreError> open(const std::filesystem::path& directory);

  // Calls back for each event that passes the filter, in the order of storing, newest last. Waits
  // for the database at most a second, should it be locked.
  [[nodiscard]] std::optional<StoreError> forEachEvent(const RecordFilter& filter,
                                                       const EventCallback& callback);
  // The same for another kind. A store of a version that did not have the kind yet has none.
  [[nodiscard]] std::optional<StoreError> forEachRecord(const RecordTable& table,
                                                        const RecordFilter& filter,
                                                        const RecordCallback& callback);

  // True when none is open, or the store's path leads to another database than it did, or to none;
  // then opening again helps, and event numbers may begin anew.
  [[nodiscard]] bool isReplaced() const;

 private:
  [[nodiscard]] StoreError failure(SqliteCode code) const;
  [[nodiscard]] std::optional<StoreError> openDatabase();
  [[nodiscard]] SqliteCode openFile();

  std::optional<StoreFiles> files_;
  Database database_;
  std::optional<FileIdentity> identity_;
};

}  // namespace halvox::platform::linux_
