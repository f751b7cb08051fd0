#include "platform/linux/store/SqliteStore.h"

#include <algorithm>
#include <cerrno>
#include <cstdlib>
#include <string_view>
#include <utility>

#include <malloc.h>

#include "platform/linux/base/ThreadSetup.h"
#include "platform/linux/store/PageCleaner.h"
#include "platform/linux/store/StoreLog.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog{storeCategory, "SqliteStore"};

// Bounds the duration of a transaction, and thereby the time until readers see a record.
constexpr std::int64_t kRecordsPerTransaction = 4096;
// After a failure, records gather for this long before the next attempt. The store then tries a
// failing disk four times a second, not once for each batch of a flood.
constexpr std::chrono::milliseconds kRetryTime{250};
// After this many bytes of payloads, an idle store releases memory: seldom enough that a busy
// service does not notice, and often enough that a rest after much work does it.
constexpr std::uint64_t kBytesBetweenReleases = 4 * 1024 * 1024;

DropReason reasonOf(SqliteCode code, int systemError) {
  const int primary = code & 0xFF;
  if (meansDamage(code)) return DropReason::kDamaged;
  if (primary == SQLITE_BUSY || primary == SQLITE_LOCKED) return DropReason::kLocked;
  const bool noRoom = systemError == ENOSPC || systemError == EDQUOT || systemError == EFBIG;
  if (primary == SQLITE_FULL || (primary == SQLITE_IOERR && noRoom)) return DropReason::kDiskFull;
  return DropReason::kInputOutput;
}

enum class Sync : std::uint8_t { kEach, kCheckpoints };

// Sets which commits wait for the disk: each, or only those that copy the log into the database.
SqliteCode syncCommits(Database& database, Sync sync) {
  return database.execute(sync == Sync::kEach ? "PRAGMA synchronous = FULL"
                                              : "PRAGMA synchronous = NORMAL");
}

// Disables SQLite's count of the memory that it uses. Counting takes a lock at each allocation, and
// nothing reads the count. SQLite accepts this setting only before its first use in the process.
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
      messages_(eventNames_, queue_, environment.statistics, sizes_.payloadBytes),
      linkMessages_(messages_),
      issueMetrics_(queue_, environment.statistics, sizes_.payloadBytes),
      powerEvents_(queue_, environment.statistics, sizes_.payloadBytes),
      snapshots_(queue_, environment.statistics, sizes_.payloadBytes),
      spooledMessages_(queue_, environment.statistics, environment.clock, sizes_.payloadBytes),
      losses_(environment.statistics, environment.clock),
      retention_({.age = std::chrono::days(options.retentionDays),
                  .databaseBytes = sizes_.databaseBytes,
                  .transactionBytes = sizes_.transactionBytes}),
      runs_(environment.clock, options.bootID),
      vacuum_(files_.database()),
      erase_(ErasePlaces{options.directory, options.root}) {}

Result<void, StoreError> SqliteStore::open() {
  configureLibrary();
  if (auto opened = openDatabase(); !opened) return opened;
  reportLastRun();
  // The writer notes this run even if no record comes.
  queue_.requestRound();
  writer_ = std::thread([this] { run(); });
  return {};
}

void SqliteStore::close() {
  vacuum_.cancel();
  erase_.cancel();
  queue_.close();
  if (writer_.joinable()) writer_.join();
}

void SqliteStore::run() {
  setUpThread("halvox-store");
  const auto takeAll = [this] {
    for (RecordKind* const kind : kinds_) kind->takeQueued();
  };
  // open() has requested the first round, in which nothing may be queued. It notes this run, and
  // runs retention: records may have expired since the last run, and the next record may come only
  // much later.
  while (queue_.take(nextRound_, takeAll)) {
    nextRound_ = std::chrono::steady_clock::now() + queue_.limits().gatherTime;
    // Replace a damaged database before writing. The records then go into the new database.
    if (const auto finding = check_.finding()) replaceDamaged(*finding);
    writeTaken();
    maintainWhileIdle();
    vacuumOnce();
    eraseOnce();
    releaseMemoryIfIdle();
  }
  writeEnd();
  closeDatabase();
}

// Records that the last run did not close the store. The event is in the transaction that notes
// this run. A clean end makes no event, because nothing is missing; the view `runs` has it.
void SqliteStore::reportLastRun() {
  const std::optional<LastRun>& last = runs_.last();
  if (!last.has_value() || last->ending == RunEnding::kClean) return;
  kLog.notice("the last run did not close the store (", endingName(last->ending),
              "); what it received just before its end may be missing");
  messages_.addEvent(clock_.currentDate().secondsSince1970, kLastRunEvent,
                     [run = *last] { return lastRunPayload(run); });
}

void SqliteStore::writeTaken() {
  while (hasTaken()) {
    if (!makeReady()) return;
    const SqliteCode code = writeTransaction();
    if (code != SQLITE_OK) return fail(code, "cannot store records");
    onStored();
    // Run retention after every transaction. Under a steady flood the writer is never idle, and the
    // file must not outgrow its limit.
    static_cast<void>(maintainOnce());
  }
}

bool SqliteStore::hasTaken() const {
  return runs_.mustWrite() ||
         std::ranges::any_of(kinds_, [](const RecordKind* kind) { return kind->hasTaken(); });
}

// Writes the last losses and the end of this run.
void SqliteStore::writeEnd() {
  runs_.finish();
  if (droppedSinceStored_ == 0) {
    losses_.finish();
    return writeTaken();
  }
  // While records are dropped, this attempt will probably fail too. The failure has been logged.
  if (database_.isOpen() && writeTransaction() == SQLITE_OK) onStored();
}

// Opens the database if it is not open. Also opens it again if its path now leads to another file
// or to none, because records in a file that has lost its name would be lost. If the database
// cannot be used, drops the taken records and returns false.
bool SqliteStore::makeReady() {
  // Call stat() for each transaction, because SQLite does not notice that its file has lost its
  // name.
  if (database_.isOpen() && files_.identity() == identity_) return logHasRoom();
  if (database_.isOpen()) {
    kLog.error(files_.database().c_str(),
               ": the database file was removed or replaced; opening the one that is there now");
    abandonDatabase();
  }
  const auto opened = openDatabase();
  if (!opened) drop(DropReason::kInputOutput, opened.error().message);
  return opened.has_value();
}

// Returns false after dropping the taken records because the write-ahead log is full. SQLite can
// reuse its log from the beginning only if no reader needs an older state of the database. A reader
// that never finishes makes the log grow without end. If the log is as large as the database may
// be, records are dropped, because they would fill the disk.
bool SqliteStore::logHasRoom() {
  if (files_.logBytes() <= sizes_.databaseBytes) return true;
  const SqliteCode code = sqlite3_wal_checkpoint_v2(database_.get(), nullptr,
                                                    SQLITE_CHECKPOINT_RESTART, nullptr, nullptr);
  if (code == SQLITE_OK) return true;
  if ((code & 0xFF) == SQLITE_BUSY) {
    drop(DropReason::kLogHeld,
         files_.database().native() +
             ": the write-ahead log has reached its size limit because another program keeps "
             "reading an old state of the database");
  } else {
    fail(code, "cannot copy the write-ahead log into the database");
  }
  return false;
}

Result<void, StoreError> SqliteStore::openDatabase() {
  // An orderly close removes the write-ahead log. If there is a log, the last run was killed, or
  // ended before it had checked the database. Look for the log before opening the database, because
  // opening makes a new one.
  bool mustCheck = files_.logBytes() > 0;
  if (auto opened = openStoreDatabase(files_, sizes_, database_); !opened) return opened;
  SqliteCode code = useDatabase();
  // useDatabase() reads the newest records and may find damage. The check is then not needed.
  if (meansDamage(code)) {
    mustCheck = false;
    if (auto begun = beginAnew(database_.errorText()); !begun) return std::move(begun).error();
    code = useDatabase();
  }
  if (code != SQLITE_OK) return cannotRead();
  if (mustCheck) {
    check_.begin(files_.database(), extent_, [this] { queue_.requestRound(); });
  }
  return {};
}

SqliteCode SqliteStore::useDatabase() {
  identity_ = files_.identity();
  const SqliteCode code = StoreExtent::read(database_, extent_);
  return code == SQLITE_OK ? prepareStatements() : code;
}

// Returns why useDatabase() failed, and closes the database.
Failure<StoreError> SqliteStore::cannotRead() {
  Failure<StoreError> failure{
      StoreError::kCannotOpen,
      files_.database().native() + ": cannot read the database: " + database_.errorText()};
  abandonDatabase();
  return failure;
}

// Renames the damaged database and opens a new one. Returns the new name of the damaged one.
Result<std::string, StoreError> SqliteStore::beginAnew(const std::string& finding) {
  abandonDatabase();
  auto newName = files_.setAside();
  if (!newName) return newName;
  kLog.error("the database is damaged: ", finding, "; it was set aside as ", *newName,
             ", and a new database takes its place");
  if (auto opened = openStoreDatabase(files_, sizes_, database_); !opened) {
    return std::move(opened).error();
  }
  return newName;
}

// Begins a new database and copies the records of this run into it: those that are newer than
// `extent_`. Records of earlier runs remain only in the renamed file.
void SqliteStore::replaceDamaged(const std::string& finding) {
  // Copy the extent of the damaged database, because useDatabase() replaces `extent_` with that of
  // the new one.
  const StoreExtent extent = extent_;
  const auto newName = beginAnew(finding);
  if (!newName) return kLog.error("", newName.error().message);
  std::string problem;
  const std::uint64_t kept = copyRecordsAfter(extent, *newName, database_, problem);
  kLog.notice("copied the ", kept, " records that were stored since the start to the new database");
  if (!problem.empty()) {
    kLog.error("cannot copy all records that were stored since the start; the others are only in ",
               *newName, ": ", problem);
  }
  // Call useDatabase() after the copy. Numbering then continues after the copied records.
  if (useDatabase() != SQLITE_OK) kLog.error("", cannotRead().message);
}

SqliteCode SqliteStore::prepareStatements() {
  // IMMEDIATE takes the lock for writing at once. If another process has locked the file, the
  // statement fails before payloads are built and encoded.
  SqliteCode code = database_.prepare("BEGIN IMMEDIATE", begin_);
  if (code == SQLITE_OK) code = database_.prepare("COMMIT", commit_);
  if (code == SQLITE_OK) code = retention_.prepare(database_);
  if (code == SQLITE_OK) code = runs_.prepare(database_);
  for (RecordKind* const kind : kinds_) {
    if (code == SQLITE_OK) code = kind->prepare(database_);
  }
  return code;
}

SqliteCode SqliteStore::writeTransaction() {
  TransactionAllowance allowance{kRecordsPerTransaction,
                                 static_cast<std::int64_t>(sizes_.transactionBytes)};
  // Set errno to 0, because fail() reads it if SQLite itself does not report the system's error.
  errno = 0;
  const bool isFirst = !runs_.isNoted();
  SqliteCode code = isFirst ? syncCommits(database_, Sync::kEach) : SQLITE_OK;
  if (code == SQLITE_OK) code = begin_.run();
  for (RecordKind* const kind : kinds_) {
    if (code == SQLITE_OK) code = kind->write(allowance);
  }
  if (code == SQLITE_OK) code = runs_.write();
  if (code == SQLITE_OK) code = commit_.run();
  if (isFirst) static_cast<void>(syncCommits(database_, Sync::kCheckpoints));
  return code;
}

void SqliteStore::onStored() {
  runs_.onCommitted();
  FinishedRecords finished;
  for (RecordKind* const kind : kinds_) kind->onCommitted(finished);
  queue_.finish(finished.written, finished.writtenBytes);
  bytesSinceRelease_ += finished.writtenBytes;
  const std::uint64_t dropped = std::exchange(droppedSinceStored_, 0);
  if (dropped > 0) kLog.notice("storing again after a failure; ", dropped, " records were dropped");
}

void SqliteStore::fail(SqliteCode code, std::string_view what) {
  // Read the errors first, because every other call replaces them. After a failed commit SQLite
  // does not return the system's error. Use errno in that case; writeTransaction() has set it to 0
  // before.
  const int lastError = errno;
  const int systemError = database_.systemError() != 0 ? database_.systemError() : lastError;
  const DropReason reason = reasonOf(code, systemError);
  const std::string description =
      files_.database().native() + ": " + std::string(what) + ": " +
      (database_.hasError() ? database_.errorText() : "a block of messages is damaged");
  if (sqlite3_get_autocommit(database_.get()) == 0) {
    static_cast<void>(database_.execute("ROLLBACK"));
  }
  drop(reason, description);
  // After a locked file or a full disk the connection is still usable. After any other error, close
  // it; makeReady() opens it again.
  if (reason == DropReason::kLocked || reason == DropReason::kDiskFull) return;
  if (reason == DropReason::kDamaged) return replaceDamaged(description);
  abandonDatabase();
}

void SqliteStore::drop(DropReason reason, std::string_view what) {
  // The time spent on a failure, such as a locked file, must not count as slow writing. The queue
  // would lower its limits and make callers wait.
  queue_.disregardTime();
  FinishedRecords finished;
  for (RecordKind* const kind : kinds_) droppedSinceStored_ += kind->dropTaken(reason, finished);
  queue_.finish(finished.written, finished.writtenBytes);
  queue_.finish(finished.unwritten, 0);
  nextRound_ = std::chrono::steady_clock::now() + kRetryTime;
  if (!failureLines_.tryPass()) return;
  kLog.error("", what, "; ", droppedSinceStored_,
             " records dropped since records were last stored; trying again with the next records");
}

void SqliteStore::maintainWhileIdle() {
  while (!queue_.hasQueued() && maintainOnce()) {
  }
}

// After 200,000 messages of four sessions, the service kept 3 MiB of free memory, the compressor
// and the pages that SQLite caches. malloc_trim() covers the memory of all threads. The writer
// calls it because it is the last to rest after messages and after the summary of a session.
void SqliteStore::releaseMemoryIfIdle() {
  if (bytesSinceRelease_ < kBytesBetweenReleases || queue_.hasQueued()) return;
  bytesSinceRelease_ = 0;
  messages_.releaseMemory();
  if (database_.isOpen()) sqlite3_db_release_memory(database_.get());
  ::malloc_trim(0);
}

// Runs one step of retention. Returns true when more remains to be deleted.
bool SqliteStore::maintainOnce() {
  if (!database_.isOpen()) return false;
  bool more = false;
  const double now = clock_.currentDate().secondsSince1970;
  errno = 0;  // read by fail()
  const SqliteCode code = retention_.runOnce(now, kinds_, more);
  if (code == SQLITE_OK) return more;
  fail(code, "cannot delete old records");
  return false;
}

bool SqliteStore::beginVacuum(const VacuumRequest& request) {
  if (!vacuum_.begin(request)) return false;
  kLog.notice("a vacuum begins; the database and its log have ", vacuum_.state().bytesBefore,
              " bytes");
  queue_.requestRound();
  return true;
}

// Runs one step of a vacuum. The next round, which stores the records that have come meanwhile,
// runs the next step.
void SqliteStore::vacuumOnce() {
  if (!vacuum_.isRunning()) return;
  if (!database_.isOpen()) return vacuum_.fail("the database is not open");
  errno = 0;
  const SqliteCode code = vacuum_.runOnce(database_, kinds_);
  if (code != SQLITE_OK) {
    vacuum_.fail(sqlite3_errstr(code));
    return fail(code, "cannot vacuum the database");
  }
  if (vacuum_.isRunning()) return queue_.requestRound();
  kLog.notice("the vacuum has ended; the database and its log have ", vacuum_.state().bytes,
              " bytes");
}

bool SqliteStore::beginErase(const EraseRequest& request) {
  if (!erase_.begin(request)) return false;
  kLog.notice("an erasure of ",
              request.application ? "one application"
              : request.session   ? "one session"
                                  : "everything before a time",
              " begins");
  queue_.requestRound();
  return true;
}

EraseState SqliteStore::eraseState() {
  EraseState state = erase_.state();
  if (state.isRunning && state.isLogHeld) queue_.requestRound();
  return state;
}

// Runs one step of an erasure, like vacuumOnce().
void SqliteStore::eraseOnce() {
  if (!erase_.isRunning()) return;
  if (!database_.isOpen()) return erase_.fail("the database is not open");
  errno = 0;
  const SqliteCode code = erase_.runOnce(database_, kinds_);
  if (code != SQLITE_OK) {
    erase_.fail(StoreErase::problemOf(code));
    if (code == PageCleaner::kUnexpectedForm) {
      kLog.error("", files_.database().native(),
                 ": cannot erase in the database: ", StoreErase::problemOf(code));
    } else {
      fail(code, "cannot erase in the database");
    }
    if (database_.isOpen()) StoreErase::resetConnection(database_);
    return;
  }
  const EraseState state = erase_.state();
  // While a reader holds the log, only new records and eraseState() make it try again.
  if (state.isRunning) return state.isLogHeld ? void() : queue_.requestRound();
  kLog.notice("the erasure has ended; ", state.records, " records and ", state.files,
              " files were erased");
}

void SqliteStore::closeDatabase() {
  const bool isChecked = check_.stop();
  releaseStatements();
  if (!database_.isOpen()) return;
  // Copy the log into the database now. sqlite3_close() does so only if no other connection is
  // open.
  sqlite3_wal_checkpoint_v2(database_.get(), nullptr, SQLITE_CHECKPOINT_PASSIVE, nullptr, nullptr);
  // Keep the log. It shows the next run that the database must be checked.
  if (!isChecked) return abandon(database_);
  database_.close();
}

void SqliteStore::abandonDatabase() {
  // Stop the check, because the caller may rename the file that the check reads. The log stays; if
  // the same file is opened again, its check is repeated.
  static_cast<void>(check_.stop());
  releaseStatements();
  abandon(database_);
}

void SqliteStore::releaseStatements() {
  begin_ = {};
  commit_ = {};
  retention_.release();
  runs_.release();
  vacuum_.release();
  erase_.release();
  for (RecordKind* const kind : kinds_) kind->release();
}

}  // namespace halvox::platform::linux_
