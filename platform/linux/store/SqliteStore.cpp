#include "platform/linux/store/SqliteStore.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <string_view>
#include <utility>

#include <pthread.h>

#include "platform/linux/store/StoreLog.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog{storeCategory, "SqliteStore"};

// Bounds how long one transaction, and with it the visibility of a record, can take.
constexpr std::int64_t kRecordsPerTransaction = 4096;
// After a failure records gather for so long before the next attempt.
constexpr std::chrono::milliseconds kRetryTime{250};

DropReason reasonOf(SqliteCode code, int systemError) {
  const int primary = code & 0xFF;
  if (meansDamage(code)) return DropReason::kDamaged;
  if (primary == SQLITE_BUSY || primary == SQLITE_LOCKED) return DropReason::kLocked;
  const bool noRoom = systemError == ENOSPC || systemError == EDQUOT || systemError == EFBIG;
  if (primary == SQLITE_FULL || (primary == SQLITE_IOERR && noRoom)) return DropReason::kDiskFull;
  return DropReason::kInputOutput;
}

// The library's count of its memory costs an atomic lock at each allocation, and nobody reads it.
void configureLibrary() {
  static const bool kDone = [] {
    sqlite3_config(SQLITE_CONFIG_MEMSTATUS, 0);
    return true;
  }();
  static_cast<void>(kDone);
}

}  // namespace

SqliteStore::SqliteStore(const StoreOptions& options, const Environment& environment)
    : sizes_(StoreSizes::of(options.maxMegabytes)),
      clock_(environment.clock),
      files_(options.directory),
      queue_(options.queue, environment.backpressure),
      eventNames_(options.wantedEvents),
      analyticsRecords_(eventNames_, queue_, environment.statistics, sizes_.payloadBytes),
      issueMetrics_(queue_, environment.statistics, sizes_.payloadBytes),
      powerEvents_(queue_, environment.statistics, sizes_.payloadBytes),
      linkMessages_(queue_, environment.statistics, sizes_.payloadBytes),
      snapshots_(queue_, environment.statistics, sizes_.payloadBytes),
      retention_({.age = std::chrono::days(options.retentionDays),
                  .databaseBytes = sizes_.databaseBytes,
                  .transactionBytes = sizes_.transactionBytes}) {}

std::optional<StoreError> SqliteStore::open() {
  configureLibrary();
  if (auto error = openDatabase()) return error;
  writer_ = std::thread([this] { run(); });
  return std::nullopt;
}

void SqliteStore::close() {
  queue_.close();
  if (writer_.joinable()) writer_.join();
}

void SqliteStore::run() {
  pthread_setname_np(pthread_self(), "halvox-store");
  maintainWhileIdle();
  const auto takeAll = [this] {
    for (RecordKind* const kind : kinds_) kind->takeQueued();
  };
  while (queue_.take(nextRound_, takeAll)) {
    nextRound_ = std::chrono::steady_clock::now() + queue_.limits().gatherTime;
    writeTaken();
    maintainWhileIdle();
  }
  closeDatabase();
}

void SqliteStore::writeTaken() {
  while (hasTaken()) {
    if (!makeReady()) return;
    const SqliteCode code = writeTransaction();
    if (code != SQLITE_OK) return fail(code, "events were not stored");
    onStored();
    static_cast<void>(maintainOnce());
  }
}

bool SqliteStore::hasTaken() const {
  return std::ranges::any_of(kinds_, [](const RecordKind* kind) { return kind->hasTaken(); });
}

// Opens the database when it is not open, and when its path leads to another file or to none.
bool SqliteStore::makeReady() {
  if (database_.isOpen() && files_.identity() == identity_) return logHasRoom();
  if (database_.isOpen()) {
    kLog.error(files_.database().c_str(), ": the file was removed or replaced, opening it anew");
    abandonDatabase();
  }
  const auto error = openDatabase();
  if (!error.has_value()) return true;
  drop(DropReason::kInputOutput, error->description);
  return false;
}

// The log cannot begin anew while somebody reads a state of the database that is older than it. A
// reader that never ends must not fill the disk.
bool SqliteStore::logHasRoom() {
  if (files_.logBytes() <= sizes_.databaseBytes) return true;
  const SqliteCode code = sqlite3_wal_checkpoint_v2(database_.get(), nullptr,
                                                    SQLITE_CHECKPOINT_RESTART, nullptr, nullptr);
  if (code == SQLITE_OK) return true;
  if ((code & 0xFF) == SQLITE_BUSY) {
    drop(DropReason::kLogHeld,
         files_.database().native() + ": the log is as large as it may be, and somebody reads it");
  } else {
    fail(code, "the log cannot be copied into the database");
  }
  return false;
}

std::optional<StoreError> SqliteStore::openDatabase() {
  if (auto error = openStoreDatabase(files_, sizes_, database_)) return error;
  identity_ = files_.identity();
  if (prepareStatements() == SQLITE_OK) return std::nullopt;
  StoreError error{
      StoreError::Kind::kCannotOpen,
      files_.database().native() + ": the database cannot be read: " + database_.errorText()};
  abandonDatabase();
  return error;
}

SqliteCode SqliteStore::prepareStatements() {
  SqliteCode code = database_.prepare("BEGIN IMMEDIATE", begin_);
  if (code == SQLITE_OK) code = database_.prepare("COMMIT", commit_);
  if (code == SQLITE_OK) code = retention_.prepare(database_);
  for (RecordKind* const kind : kinds_) {
    if (code == SQLITE_OK) code = kind->prepare(database_);
  }
  return code;
}

SqliteCode SqliteStore::writeTransaction() {
  TransactionAllowance allowance{kRecordsPerTransaction,
                                 static_cast<std::int64_t>(sizes_.transactionBytes)};
  errno = 0;
  SqliteCode code = begin_.run();
  for (RecordKind* const kind : kinds_) {
    if (code == SQLITE_OK) code = kind->write(allowance);
  }
  if (code == SQLITE_OK) code = commit_.run();
  return code;
}

void SqliteStore::onStored() {
  FinishedRecords finished;
  for (RecordKind* const kind : kinds_) kind->onCommitted(finished);
  queue_.finish(finished.written, finished.writtenBytes);
  const std::uint64_t dropped = std::exchange(droppedSinceStored_, 0);
  if (dropped > 0) kLog.notice("storing again; ", dropped, " events were dropped");
}

void SqliteStore::fail(SqliteCode code, std::string_view what) {
  // Before anything else, because every call replaces the last error. For a failed commit the
  // library does not say what the system said; then it is the last that the system said at all.
  const int lastError = errno;
  const int systemError = database_.systemError() != 0 ? database_.systemError() : lastError;
  const DropReason reason = reasonOf(code, systemError);
  const std::string description =
      files_.database().native() + ": " + std::string(what) + ": " + database_.errorText();
  if (sqlite3_get_autocommit(database_.get()) == 0) {
    static_cast<void>(database_.execute("ROLLBACK"));
  }
  drop(reason, description);
  // After these two the connection is as good as new.
  if (reason == DropReason::kLocked || reason == DropReason::kDiskFull) return;
  abandonDatabase();
  if (reason != DropReason::kDamaged) return;
  std::string newName;
  if (const auto error = files_.setAside(newName)) {
    kLog.error("", error->description);
  } else {
    kLog.error("the damaged database was set aside as ", newName);
  }
}

void SqliteStore::drop(DropReason reason, std::string_view what) {
  // Waiting for a locked file must not look like slow writing, or callers would have to wait too.
  queue_.disregardTime();
  FinishedRecords finished;
  for (RecordKind* const kind : kinds_) droppedSinceStored_ += kind->dropTaken(reason, finished);
  queue_.finish(finished.written, finished.writtenBytes);
  queue_.finish(finished.unwritten, 0);
  nextRound_ = std::chrono::steady_clock::now() + kRetryTime;
  if (!failureLines_.tryPass()) return;
  kLog.error("", what, "; ", droppedSinceStored_, " events dropped since the last were stored");
}

void SqliteStore::maintainWhileIdle() {
  while (!queue_.hasQueued() && maintainOnce()) {
  }
}

// Deletes a little of what is due; true when there is more.
bool SqliteStore::maintainOnce() {
  if (!database_.isOpen()) return false;
  bool more = false;
  const double now = clock_.currentDate().secondsSince1970;
  const SqliteCode code = retention_.runOnce(now, kinds_, more);
  if (code == SQLITE_OK) return more;
  fail(code, "old events were not deleted");
  return false;
}

void SqliteStore::closeDatabase() {
  releaseStatements();
  if (!database_.isOpen()) return;
  // Closing does this too, but only when nobody reads.
  sqlite3_wal_checkpoint_v2(database_.get(), nullptr, SQLITE_CHECKPOINT_PASSIVE, nullptr, nullptr);
  database_.close();
}

void SqliteStore::abandonDatabase() {
  releaseStatements();
  abandon(database_);
}

void SqliteStore::releaseStatements() {
  begin_ = {};
  commit_ = {};
  retention_.release();
  for (RecordKind* const kind : kinds_) kind->release();
}

}  // namespace halvox::platform::linux_
