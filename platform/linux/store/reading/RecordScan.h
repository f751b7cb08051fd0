#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/store/RecordTables.h"
#include "platform/linux/store/Sqlite.h"
#include "platform/linux/store/reading/StoreReader.h"

namespace halvox::platform::linux_ {

// The range of record numbers to read. It includes all records that pass a filter, and may include
// others.
struct RecordBounds {
  std::int64_t first = 1;
  std::int64_t last = 0;
};

// Narrows the bounds to the times of the filter. Uses the spans and reads no records. Before the
// call, set `bounds.first` to the first record that may be needed.
[[nodiscard]] SqliteCode findBounds(Database& database, const std::string& recordsTable,
                                    const std::string& spansTable, const RecordFilter& filter,
                                    RecordBounds& bounds);
[[nodiscard]] bool isWithinTimes(const RecordFilter& filter, double time);
// Returns true if at least one pattern matches, or if there are no patterns.
[[nodiscard]] bool matchesAny(const std::vector<std::string>& patterns, const std::string& name);

// A piece of a scan ends when the first of these bounds is reached. The first two bound the memory
// of a piece. The third bounds how long a snapshot is held if few records pass the filter.
constexpr std::size_t kRecordsPerPiece = 512;
constexpr std::size_t kBytesPerPiece = 1U << 20U;
constexpr int kLooksPerPiece = 50'000;

// One pass over the records of one kind that pass a filter, in the filter's order. Reads in pieces,
// and holds no snapshot between two pieces; StoreReader says why. Reads no record that was stored
// after it began. Belongs to the thread of its database and does not own its arguments. After an
// error the scan is over.
class RecordScan {
 public:
  RecordScan(Database& database, const RecordTable& table, const RecordFilter& filter)
      : database_(database), table_(table), filter_(filter) {}

  // Finds the first and the last record to read. Call once, before next().
  [[nodiscard]] SqliteCode begin();
  // Reads the next piece. A piece may be empty although more follow. Only isAtEnd() shows the end.
  [[nodiscard]] SqliteCode next(std::vector<StoredRecord>& piece);
  [[nodiscard]] bool isAtEnd() const { return bounds_.first > bounds_.last; }
  // Returns the last record that a pass in the order of storing looks at, whether or not it passes
  // the filter. Known after begin().
  [[nodiscard]] StoredRecordID last() const { return bounds_.last; }

 private:
  [[nodiscard]] bool passes(const Statement& row) const;
  [[nodiscard]] StoredRecord read(const Statement& row, std::size_t& bytes) const;
  [[nodiscard]] SqliteCode skipToNewest(std::uint64_t count);
  [[nodiscard]] SqliteCode prepare(RecordOrder order, Statement& statement);

  Database& database_;
  const RecordTable& table_;
  const RecordFilter& filter_;
  RecordBounds bounds_;
  Statement read_;
};

}  // namespace halvox::platform::linux_
