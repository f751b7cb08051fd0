#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/store/RecordTables.h"
#include "platform/linux/store/Sqlite.h"
#include "platform/linux/store/StoreReader.h"

namespace halvox::platform::linux_ {

// The numbers of the first and the last record that a filter's bounds let through; later ones may
// still be older or younger than them.
struct RecordBounds {
  std::int64_t first = 1;
  std::int64_t last = 0;
};

// Finds the bounds from the times of the spans, without looking at records. `bounds.first` is
// given.
[[nodiscard]] SqliteCode findBounds(Database& database, const std::string& recordsTable,
                                    const std::string& spansTable, const RecordFilter& filter,
                                    RecordBounds& bounds);
[[nodiscard]] bool isWithinTimes(const RecordFilter& filter, double time);
// Whether one of the patterns matches, or there is none.
[[nodiscard]] bool matchesAny(const std::vector<std::string>& patterns, const std::string& name);

// The bounds of one piece of a scan: what it holds, and how long it keeps its snapshot.
constexpr std::size_t kRecordsPerPiece = 512;
constexpr std::size_t kBytesPerPiece = 1U << 20U;
constexpr int kLooksPerPiece = 50'000;

// One pass over the records of one kind that match a filter, in pieces, so that no snapshot is held
// between them. Ends with what was stored when it began. Belongs to the thread of its database,
// which it does not own.
class RecordScan {
 public:
  RecordScan(Database& database, const RecordTable& table, const RecordFilter& filter)
      : database_(database), table_(table), filter_(filter) {}

  // Finds where to begin and to end.
  [[nodiscard]] SqliteCode begin();
  // Reads on. A piece may be empty though more follow.
  [[nodiscard]] SqliteCode next(std::vector<StoredRecord>& piece);
  [[nodiscard]] bool isAtEnd() const { return bounds_.first > bounds_.last; }

 private:
  [[nodiscard]] bool passes(const Statement& row) const;
  [[nodiscard]] StoredRecord read(const Statement& row, std::size_t& bytes) const;
  [[nodiscard]] SqliteCode skipToNewest(std::uint64_t count);
  [[nodiscard]] SqliteCode prepare(std::string_view order, Statement& statement);

  Database& database_;
  const RecordTable& table_;
  const RecordFilter& filter_;
  RecordBounds bounds_;
  Statement read_;
};

}  // namespace halvox::platform::linux_
