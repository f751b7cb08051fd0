#pragma once

#include <array>
#include <cstdint>
#include <optional>

#include "platform/linux/base/Result.h"
#include "platform/linux/store/MessageBlocks.h"
#include "platform/linux/store/OldRecords.h"
#include "platform/linux/store/RecordTables.h"
#include "platform/linux/store/StoreError.h"
#include "platform/linux/store/StoreOpening.h"
#include "platform/linux/store/spool/SpoolTable.h"

namespace halvox::platform::linux_ {

// The blocks of messages of a store to which nothing is added.
class StoredMessages final : public RecordKind {
 public:
  [[nodiscard]] SqliteCode prepare(Database& database) override {
    return blocks_.prepare(database);
  }
  void release() override { blocks_.release(); }
  void takeQueued() override {}
  [[nodiscard]] bool hasTaken() const override { return false; }
  [[nodiscard]] SqliteCode write(TransactionAllowance& /*allowance*/) override { return SQLITE_OK; }
  void onCommitted(FinishedRecords& /*finished*/) override {}
  std::uint64_t dropTaken(DropReason /*reason*/, FinishedRecords& /*finished*/) override {
    return 0;
  }
  [[nodiscard]] SqliteCode oldestTime(std::optional<double>& time) override {
    return blocks_.oldestTime(time);
  }
  [[nodiscard]] SqliteCode deleteOldest(bool& found) override {
    return blocks_.deleteOldest(found);
  }
  [[nodiscard]] SqliteCode deleteOlderThan(double time, bool& found) override {
    return blocks_.deleteOlderThan(time, found);
  }
  [[nodiscard]] SqliteCode erase(Database& database, ErasePass& pass, bool& more) override {
    return blocks_.erase(database, pass, more);
  }

 private:
  MessageBlocks blocks_;
};

// All kinds of records of a store that no service uses.
struct StoredKinds {
  StoredMessages messages;
  OldRecords issueMetrics{kIssueMetrics.records, kIssueMetrics.spans};
  OldRecords powerEvents{kPowerEvents.records, kPowerEvents.spans};
  OldRecords snapshots{kSnapshots.records, kSnapshots.spans};
  OldRecords losses{kLosses.records, kLosses.spans};
  OldRecords events{"analytics_records", "analytics_spans"};
  OldRecords linkMessages{kLinkMessages.records, kLinkMessages.spans};
  StoredSpool spool;
  const std::array<RecordKind*, 8> all{&messages, &issueMetrics, &powerEvents,  &snapshots,
                                       &losses,   &events,       &linkMessages, &spool};

  [[nodiscard]] SqliteCode prepare(Database& database) {
    SqliteCode code = SQLITE_OK;
    for (RecordKind* const kind : all) {
      if (code == SQLITE_OK) code = kind->prepare(database);
    }
    return code;
  }
  void release() {
    for (RecordKind* const kind : all) kind->release();
  }
};

// Opens the store of a service that does not run, and takes its lock. Checks a database that its
// service did not close, and leaves a damaged one as it is. Blocks on the disk.
Result<void, StoreError> openUnserved(StoreFiles& files, const StoreSizes& sizes,
                                      Database& database);

}  // namespace halvox::platform::linux_
