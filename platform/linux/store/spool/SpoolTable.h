#pragma once

#include <cstdint>
#include <optional>

#include "platform/linux/store/RecordKind.h"
#include "platform/linux/store/Sqlite.h"

namespace halvox::platform::linux_ {

// The oldest rows of the table link_spool, which retention and a vacuum delete. Functions return an
// SQLite code. Owner and thread are those of the RecordKind that uses it.
class SpoolTable {
 public:
  struct Row {
    std::int64_t first = 0;    // the number of its first message
    std::uint64_t unsent = 0;  // messages that no server has acknowledged
    double time = 0;           // seconds since 1970
  };

  [[nodiscard]] SqliteCode prepare(Database& database);
  void release();
  // Sets `row` to the oldest row; std::nullopt if the table is empty.
  [[nodiscard]] SqliteCode readOldest(std::optional<Row>& row);
  [[nodiscard]] SqliteCode remove(const Row& row);
  // Visits the next row of a pass; see RecordKind::erase(). An erased message leaves an empty one
  // in its place, so that the numbers of the others stay.
  [[nodiscard]] static SqliteCode erase(Database& database, ErasePass& pass, bool& more);

 private:
  Statement oldest_;
  Statement remove_;
};

// The table of a store to which nothing is added.
class StoredSpool final : public RecordKind {
 public:
  [[nodiscard]] SqliteCode prepare(Database& database) override { return table_.prepare(database); }
  void release() override { table_.release(); }
  void takeQueued() override {}
  [[nodiscard]] bool hasTaken() const override { return false; }
  [[nodiscard]] SqliteCode write(TransactionAllowance& /*allowance*/) override { return SQLITE_OK; }
  void onCommitted(FinishedRecords& /*finished*/) override {}
  std::uint64_t dropTaken(DropReason /*reason*/, FinishedRecords& /*finished*/) override {
    return 0;
  }
  [[nodiscard]] SqliteCode oldestTime(std::optional<double>& time) override;
  [[nodiscard]] SqliteCode deleteOldest(bool& found) override;
  [[nodiscard]] SqliteCode deleteOlderThan(double time, bool& found) override;
  [[nodiscard]] SqliteCode erase(Database& database, ErasePass& pass, bool& more) override {
    return SpoolTable::erase(database, pass, more);
  }

 private:
  SpoolTable table_;
};

}  // namespace halvox::platform::linux_
