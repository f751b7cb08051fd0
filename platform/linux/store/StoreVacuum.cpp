#include "platform/linux/store/StoreVacuum.h"

#include <algorithm>
#include <chrono>
#include <utility>

#include "platform/linux/store/StoreFiles.h"
#include "platform/linux/store/StoreSpace.h"
#include "platform/linux/store/StoredKinds.h"

namespace halvox::platform::linux_ {
namespace {

// Retention keeps a part of the largest size free for the next transaction. A vacuum reserves
// little, because people expect about the size that they named.
constexpr std::uint64_t kShareReserved = 64;
constexpr std::uint64_t kLeastReserved = std::uint64_t{64} * 1024;
constexpr std::uint64_t kMostReserved = std::uint64_t{256} * 1024;
// Larger than any file.
constexpr std::uint64_t kAnySize = std::uint64_t{1} << 62U;

Failure<StoreError> cannotVacuum(const std::filesystem::path& file, const std::string& why) {
  return {StoreError::kCannotOpen, file.native() + ": cannot vacuum the database: " + why};
}

}  // namespace

Dictionary describe(const VacuumState& state) {
  return {{"running", state.isRunning},
          {"before", state.bytesBefore},
          {"bytes", state.bytes},
          {"log held", state.isLogHeld},
          {"problem", state.problem}};
}

bool StoreVacuum::begin(const VacuumRequest& request) {
  const std::uint64_t bytes = bytesWithLog(database_);
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
    code = giveBackPages(database, more);
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
      .before = request.before.value_or(0)});
  const SqliteCode code = step_->retention.prepare(database);
  if (code != SQLITE_OK) release();
  return code;
}

SqliteCode StoreVacuum::finish(Database& database) {
  release();
  bool isHeld = false;
  const SqliteCode code = emptyLog(database, isHeld);
  if (code != SQLITE_OK) return code;
  noteBytes();
  const MutexLock lock(mutex_);
  state_.isLogHeld = isHeld;
  state_.isRunning = false;
  return SQLITE_OK;
}

void StoreVacuum::noteBytes() {
  const std::uint64_t bytes = bytesWithLog(database_);
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
  if (auto opened = openUnserved(files, sizes, database); !opened) return std::move(opened).error();
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
