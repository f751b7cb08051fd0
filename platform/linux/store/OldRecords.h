#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include "platform/linux/store/RecordKind.h"
#include "platform/linux/store/RecordSpans.h"

namespace halvox::platform::linux_ {

// The records that an earlier version stored in one row each, in tables to which nothing is added
// any more. They stay there until retention deletes them.
// Threads, owner and failures are those of RecordKind.
class OldRecords final : public RecordKind {
 public:
  // The names of the kind's tables. Pass constants, because the names are not copied.
  OldRecords(std::string_view records, std::string_view spans) : spans_(records, spans) {}

  [[nodiscard]] SqliteCode prepare(Database& database) override { return spans_.prepare(database); }
  void release() override { spans_.release(); }
  void takeQueued() override {}
  [[nodiscard]] bool hasTaken() const override { return false; }
  [[nodiscard]] SqliteCode write(TransactionAllowance& /*allowance*/) override { return SQLITE_OK; }
  void onCommitted(FinishedRecords& /*finished*/) override {}
  std::uint64_t dropTaken(DropReason /*reason*/, FinishedRecords& /*finished*/) override {
    return 0;
  }
  [[nodiscard]] SqliteCode oldestTime(std::optional<double>& time) override {
    return spans_.oldestTime(time);
  }
  [[nodiscard]] SqliteCode deleteOldest(bool& found) override { return spans_.deleteOldest(found); }
  [[nodiscard]] SqliteCode deleteOlderThan(double time, bool& found) override {
    return spans_.deleteOlderThan(time, found);
  }

 private:
  RecordSpans spans_;
};

}  // namespace halvox::platform::linux_
