#pragma once

#include <cstdint>

#include "platform/linux/store/KindWithSpans.h"

namespace halvox::platform::linux_ {

// The records that an earlier version stored in one row each, in tables to which nothing is added
// any more. They stay there until retention deletes them.
// Threads, owner and failures are those of RecordKind.
class OldRecords final : public KindWithSpans {
 public:
  using KindWithSpans::KindWithSpans;

  [[nodiscard]] SqliteCode prepare(Database& database) override {
    return spans().prepare(database);
  }
  void release() override { spans().release(); }
  void takeQueued() override {}
  [[nodiscard]] bool hasTaken() const override { return false; }
  [[nodiscard]] SqliteCode write(TransactionAllowance& /*allowance*/) override { return SQLITE_OK; }
  void onCommitted(FinishedRecords& /*finished*/) override {}
  std::uint64_t dropTaken(DropReason /*reason*/, FinishedRecords& /*finished*/) override {
    return 0;
  }
};

}  // namespace halvox::platform::linux_
