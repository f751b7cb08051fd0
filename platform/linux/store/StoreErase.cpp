#include "platform/linux/store/StoreErase.h"

#include <chrono>
#include <optional>

#include <poll.h>

#include "platform/linux/store/PageCleaner.h"
#include "platform/linux/store/Retention.h"
#include "platform/linux/store/StoreFiles.h"
#include "platform/linux/store/StoreSchema.h"
#include "platform/linux/store/StoreSpace.h"
#include "platform/linux/store/StoredKinds.h"

namespace halvox::platform::linux_ {
namespace {

// A step looks at this many blocks of messages, or pieces of a table. One takes about 1 ms.
constexpr int kVisitsPerStep = 8;
constexpr std::uint64_t kAnySize = std::uint64_t{1} << 62U;
constexpr std::uint64_t kReserved = std::uint64_t{256} * 1024;
// How long an erasure without a service waits for readers.
constexpr std::chrono::milliseconds kPause{50};
constexpr int kMostPauses = 100;

std::filesystem::path databaseOf(const ErasePlaces& places) {
  return places.directory / kStoreFileName;
}

// SQLite then clears pages that it frees or uses again.
SqliteCode clearFreed(Database& database, bool isOn) {
  return database.execute(isOn ? "PRAGMA secure_delete = ON" : "PRAGMA secure_delete = OFF");
}

// Carries out a step that does not wait for readers: records must be stored meanwhile.
template <typename Step>
SqliteCode withoutWaiting(Database& database, Step step) {
  sqlite3_busy_timeout(database.get(), 0);
  const SqliteCode code = step();
  sqlite3_busy_timeout(database.get(), static_cast<int>(kWriterBusyTimeout.count()));
  return code;
}

}  // namespace

struct StoreErase::Work {
  enum class Step : std::uint8_t {
    kLook,
    kErase,
    kAge,
    kFiles,
    kShrink,
    kClean,
    kShrinkAgain,
    kEnd
  };

  Work(EraseRequest request, const ErasePlaces& places)
      : selection(std::move(request)), files(places), cleaner(databaseOf(places)) {}

  EraseSelection selection;
  EraseFiles files;
  PageCleaner cleaner;
  Retention retention{
      {.age = std::chrono::seconds(0), .databaseBytes = kAnySize, .transactionBytes = kReserved}};
  Step step = Step::kLook;
  std::vector<ErasePass> passes{};  // one for each kind
  std::size_t kind = 0;
  std::uint64_t records = 0;
};

Dictionary describe(const EraseState& state) {
  return {{"running", state.isRunning},
          {"records", state.records},
          {"files", state.files},
          {"log held", state.isLogHeld},
          {"problem", state.problem}};
}

bool StoreErase::begin(const EraseRequest& request) {
  const MutexLock lock(mutex_);
  if (state_.isRunning || isCancelled_) return false;
  request_ = request;
  state_ = {.isRunning = true};
  return true;
}

void StoreErase::cancel() {
  const MutexLock lock(mutex_);
  isCancelled_ = true;
  if (!std::exchange(state_.isRunning, false)) return;
  state_.problem = "the service ended before the erasure was complete";
}

EraseState StoreErase::state() {
  const MutexLock lock(mutex_);
  return state_;
}

bool StoreErase::isRunning() {
  const MutexLock lock(mutex_);
  return state_.isRunning;
}

void StoreErase::release() { work_.reset(); }

void StoreErase::resetConnection(Database& database) {
  static_cast<void>(clearFreed(database, false));
}

std::string StoreErase::problemOf(SqliteCode code) {
  if (code != PageCleaner::kUnexpectedForm) return sqlite3_errstr(code);
  return "a page of the database has an unexpected form; run \"halvoxctl verify\"";
}

void StoreErase::fail(const std::string& problem) {
  release();
  const MutexLock lock(mutex_);
  if (!std::exchange(state_.isRunning, false)) return;
  state_.problem = problem;
}

SqliteCode StoreErase::runOnce(Database& database, std::span<RecordKind* const> kinds) {
  if (!isRunning()) return SQLITE_OK;
  SqliteCode code = work_ ? SQLITE_OK : prepare(database);
  bool isHeld = false;
  if (code == SQLITE_OK) code = step(database, kinds, isHeld);
  const bool isOver = code != SQLITE_OK || work_->step == Work::Step::kEnd;
  if (code != SQLITE_OK) return code;
  if (isOver) resetConnection(database);
  const MutexLock lock(mutex_);
  state_.records = work_->records;
  state_.files = work_->files.erased();
  state_.isLogHeld = isHeld;
  if (isOver && std::exchange(state_.isRunning, false)) state_.problem = work_->files.problem();
  if (isOver) work_.reset();
  return SQLITE_OK;
}

SqliteCode StoreErase::prepare(Database& database) {
  EraseRequest request;
  {
    const MutexLock lock(mutex_);
    request = request_;
  }
  work_ = std::make_shared<Work>(request, places_);
  work_->step = request.before ? Work::Step::kAge : Work::Step::kLook;
  const SqliteCode code = clearFreed(database, true);
  return code == SQLITE_OK ? work_->retention.prepare(database) : code;
}

SqliteCode StoreErase::step(Database& database, std::span<RecordKind* const> kinds, bool& held) {
  using Step = Work::Step;
  bool more = false;
  SqliteCode code = SQLITE_OK;
  switch (work_->step) {
    case Step::kLook:
    case Step::kErase:
      return visit(database, kinds);
    case Step::kAge:
      code = work_->retention.runOnce(*work_->selection.request().before, kinds, more);
      if (code == SQLITE_OK && !more) {
        work_->files.begin();
        work_->step = Step::kFiles;
      }
      return code;
    case Step::kFiles:
      if (!work_->files.eraseNext(work_->selection)) {
        work_->retention.release();
        work_->step = Step::kShrink;
      }
      return SQLITE_OK;
    case Step::kShrink:
      code = giveBackPages(database, more);
      if (!more) work_->step = Step::kClean;
      return code;
    case Step::kClean:
      return withoutWaiting(database, [&] { return clean(database, held); });
    case Step::kShrinkAgain:
      code = giveBackPages(database, more);
      if (code != SQLITE_OK || more) return code;
      code = withoutWaiting(database, [&] { return emptyLog(database, held); });
      if (code == SQLITE_OK && !held) work_->step = Step::kEnd;
      return code;
    case Step::kEnd:
      return SQLITE_OK;
  }
  return SQLITE_OK;
}

// Visits some records of one kind after the other: all to look at them, and then all to erase.
SqliteCode StoreErase::visit(Database& database, std::span<RecordKind* const> kinds) {
  Work& work = *work_;
  if (work.passes.empty()) {
    work.passes.assign(kinds.size(), ErasePass{.selection = &work.selection});
  }
  SqliteCode code = database.execute("BEGIN IMMEDIATE");
  bool more = true;
  for (int count = 0; code == SQLITE_OK && more && count < kVisitsPerStep; ++count) {
    code = kinds[work.kind]->erase(database, work.passes[work.kind], more);
  }
  if (code == SQLITE_OK) code = database.execute("COMMIT");
  if (code != SQLITE_OK) return code;
  work.records = 0;
  for (const ErasePass& pass : work.passes) work.records += pass.erased;
  if (more || ++work.kind < kinds.size()) return SQLITE_OK;
  work.kind = 0;
  if (work.step == Work::Step::kErase) {
    work.files.begin();
    work.step = Work::Step::kFiles;
    return SQLITE_OK;
  }
  work.selection.endLook();
  for (ErasePass& pass : work.passes) {
    pass.isLooking = false;
    pass.next = 0;
  }
  work.step = Work::Step::kErase;
  return SQLITE_OK;
}

SqliteCode StoreErase::clean(Database& database, bool& held) {
  // Another program made this database, in which unused space cannot be found page by page.
  if (!PageCleaner::canClean(database)) {
    work_->step = Work::Step::kShrinkAgain;
    return database.execute("VACUUM");
  }
  bool more = false;
  const SqliteCode code = work_->cleaner.cleanOnce(database, more, held);
  if (code == SQLITE_OK && !more) work_->step = Work::Step::kShrinkAgain;
  return code;
}

Result<EraseState, StoreError> eraseStore(const ErasePlaces& places, const StoreSizes& sizes,
                                          const EraseRequest& request,
                                          const std::function<void(const EraseState&)>& progress) {
  StoreFiles files(places.directory);
  Database database;
  if (auto opened = openUnserved(files, sizes, database); !opened) return std::move(opened).error();
  StoredKinds kinds;
  StoreErase erase(places);
  erase.begin(request);
  SqliteCode code = kinds.prepare(database);
  int pauses = 0;
  while (code == SQLITE_OK && erase.isRunning() && pauses < kMostPauses) {
    code = erase.runOnce(database, kinds.all);
    const EraseState state = erase.state();
    if (progress) progress(state);
    if (!state.isLogHeld) continue;
    ::poll(nullptr, 0, static_cast<int>(kPause.count()));
    ++pauses;
  }
  erase.release();
  kinds.release();
  if (code == SQLITE_OK) return erase.state();
  return Failure<StoreError>{
      StoreError::kCannotOpen,
      files.database().native() + ": cannot erase in the database: " + StoreErase::problemOf(code)};
}

}  // namespace halvox::platform::linux_
