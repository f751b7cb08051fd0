#include "platform/linux/store/StoreVacuum.h"

#include <algorithm>
#include <array>
#include <chrono>
#include <system_error>
#include <utility>

#include "platform/linux/store/MessageBlocks.h"
#include "platform/linux/store/OldRecords.h"
#include "platform/linux/store/RecordTables.h"
#include "platform/linux/store/StoreFiles.h"
#include "platform/linux/store/StoreSchema.h"
#include "platform/linux/store/spool/SpoolTable.h"

namespace halvox::platform::linux_ {
namespace {

// How many pages one step gives back. Each moved page is written to the log, and waiting records
// must not be held up for long.
constexpr int kPagesPerStep = 64;
// Retention keeps a part of the largest size free for the next transaction. A vacuum reserves
// little, because people expect about the size that they named.
constexpr std::uint64_t kShareReserved = 64;
constexpr std::uint64_t kLeastReserved = std::uint64_t{64} * 1024;
constexpr std::uint64_t kMostReserved = std::uint64_t{256} * 1024;
// Larger than any file.
constexpr std::uint64_t kAnySize = std::uint64_t{1} << 62U;

std::uint64_t bytesOf(const std::filesystem::path& database) {
  std::uint64_t sum = 0;
  for (const char* const suffix : {"", "-wal"}) {
    std::error_code error;
    const std::uintmax_t bytes = std::filesystem::file_size(database.native() + suffix, error);
    if (!error) sum += bytes;
  }
  return sum;
}

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
};

Failure<StoreError> cannotVacuum(const std::filesystem::path& file, const std::string& why) {
  return {StoreError::kCannotOpen, file.native() + ": cannot vacuum the database: " + why};
}

}  // namespace

bool StoreVacuum::begin(const VacuumRequest& request) {
  const std::uint64_t bytes = bytesOf(database_);
  const MutexLock lock(mutex_);
  if (state_.isRunning || isCancelled_) return false;
  request_ = request;
  state_ = {.isRunning = true, .bytesBefore = bytes, .bytes = bytes};
  return true;
}

void StoreVacuum::cancel() {
  const MutexLock lock(mutex_);
  isCancelled_ = true;
  if (!std::exchange(state_.isRunning, false)) return;
  state_.problem = "the service ended before the vacuum was complete";
}

VacuumState StoreVacuum::state() {
  const MutexLock lock(mutex_);
  return state_;
}

bool StoreVacuum::isRunning() {
  const MutexLock lock(mutex_);
  return state_.isRunning;
}

SqliteCode StoreVacuum::runOnce(Database& database, std::span<RecordKind* const> kinds) {
  if (!isRunning()) return SQLITE_OK;
  SqliteCode code = step_ ? SQLITE_OK : prepare(database);
  if (code != SQLITE_OK) return code;
  bool more = false;
  if (step_->isDeleting) {
    code = step_->retention.runOnce(step_->before, kinds, more);
    step_->isDeleting = more;
    more = true;
  } else {
    code = shrink(database, more);
  }
  noteBytes();
  return code == SQLITE_OK && !more ? finish(database) : code;
}

SqliteCode StoreVacuum::prepare(Database& database) {
  VacuumRequest request;
  {
    const MutexLock lock(mutex_);
    request = request_;
  }
  const std::uint64_t bytes = request.toBytes.value_or(kAnySize);
  const std::uint64_t reserved = std::clamp(bytes / kShareReserved, kLeastReserved, kMostReserved);
  step_.emplace(Step{
      .retention = Retention(
          {.age = std::chrono::seconds(0), .databaseBytes = bytes, .transactionBytes = reserved}),
      .shrink = {},
      .before = request.before.value_or(0)});
  SqliteCode code = step_->retention.prepare(database);
  if (code == SQLITE_OK) {
    code = database.prepare("PRAGMA incremental_vacuum(" + std::to_string(kPagesPerStep) + ")",
                            step_->shrink);
  }
  if (code != SQLITE_OK) release();
  return code;
}

SqliteCode StoreVacuum::shrink(Database& database, bool& more) {
  const auto before = database.queryInteger("PRAGMA freelist_count").value_or(0);
  if (before == 0) return SQLITE_OK;
  const SqliteCode code = step_->shrink.run();
  const auto after = database.queryInteger("PRAGMA freelist_count").value_or(0);
  // A database that another program made may be one that cannot shrink.
  more = after > 0 && after < before;
  return code;
}

SqliteCode StoreVacuum::finish(Database& database) {
  release();
  // Copy the log into the database, which becomes shorter only now, and empty the log. If a reader
  // needs an older state, SQLite does this after a later transaction.
  const SqliteCode code = sqlite3_wal_checkpoint_v2(database.get(), nullptr,
                                                    SQLITE_CHECKPOINT_TRUNCATE, nullptr, nullptr);
  const bool isHeld = code == SQLITE_BUSY || code == SQLITE_LOCKED;
  if (code != SQLITE_OK && !isHeld) return code;
  noteBytes();
  const MutexLock lock(mutex_);
  state_.isLogHeld = isHeld;
  state_.isRunning = false;
  return SQLITE_OK;
}

void StoreVacuum::noteBytes() {
  const std::uint64_t bytes = bytesOf(database_);
  const MutexLock lock(mutex_);
  state_.bytes = bytes;
}

void StoreVacuum::fail(const std::string& problem) {
  release();
  const MutexLock lock(mutex_);
  if (!std::exchange(state_.isRunning, false)) return;
  state_.problem = problem;
}

Result<VacuumState, StoreError> vacuumStore(
    const std::filesystem::path& directory, const StoreSizes& sizes, const VacuumRequest& request,
    const std::function<void(const VacuumState&)>& progress) {
  StoreFiles files(directory);
  Database database;
  const bool mustCheck = files.logBytes() > 0;
  if (auto opened = openIntactDatabase(files, sizes, database); !opened) {
    return std::move(opened).error();
  }
  // Emptying the log removes the sign by which a service knows that it must check its database.
  // The check must therefore come first.
  if (mustCheck) {
    Statement check;
    const bool isSound = database.prepare("PRAGMA quick_check(1)", check) == SQLITE_OK &&
                         check.step() == SQLITE_ROW && check.text(0) == "ok";
    check = {};
    if (!isSound) {
      abandon(database);
      return Failure<StoreError>{StoreError::kDamaged,
                                 files.database().native() + ": the database is damaged"};
    }
  }
  StoredKinds kinds;
  StoreVacuum vacuum(files.database());
  vacuum.begin(request);
  SqliteCode code = kinds.prepare(database);
  while (code == SQLITE_OK && vacuum.isRunning()) {
    code = vacuum.runOnce(database, kinds.all);
    if (progress) progress(vacuum.state());
  }
  vacuum.release();
  for (RecordKind* const kind : kinds.all) kind->release();
  if (code != SQLITE_OK) return cannotVacuum(files.database(), sqlite3_errstr(code));
  return vacuum.state();
}

}  // namespace halvox::platform::linux_
