#include "platform/linux/store/StoreCheck.h"

#include <algorithm>
#include <chrono>
#include <limits>
#include <system_error>
#include <utility>

#include <linux/ioprio.h>
#include <sys/resource.h>
#include <sys/syscall.h>
#include <unistd.h>

#include "platform/linux/base/ThreadSetup.h"
#include "platform/linux/store/StoreLog.h"
#include "platform/linux/store/StoreOpening.h"
#include "platform/linux/store/blocks/MessageBlockReader.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog{storeCategory, "StoreCheck"};

using Clock = std::chrono::steady_clock;

// How long one slice of the check reads. The time is short enough to delay the writer's checkpoints
// no longer than a commit takes on a slow disk, and long enough to read a few megabytes from a fast
// disk.
constexpr std::chrono::milliseconds kSlice{20};
constexpr std::chrono::milliseconds kShortestPause{1};
constexpr std::chrono::milliseconds kBusyTimeout{250};

constexpr const char* kNotCheckedNow = "; it is not checked before the next start";

// Lowers the priority of this thread for the processor and for the disk. The scheduler's idle class
// would be too low: on a busy machine a slice would not end for minutes, and the write-ahead log
// would grow in that time. Lowering the priority needs no privilege. If the kernel refuses it, only
// the pauses limit the load.
void giveWayToOthers() {
  constexpr int kNice = 10;
  static_cast<void>(::setpriority(PRIO_PROCESS, static_cast<id_t>(::gettid()), kNice));
  static_cast<void>(
      ::syscall(SYS_ioprio_set, IOPRIO_WHO_PROCESS, 0, IOPRIO_PRIO_VALUE(IOPRIO_CLASS_IDLE, 0)));
}

// Unpacks a block. Its checksum shows damage that SQLite does not see. Columns 2 and 5 of the row
// are `records` and `block`.
bool isSound(const Statement& row, MessageBlockReader& reader, std::uint64_t& count) {
  reader.open(row.bytes(5), row.integer(2));
  while (reader.next()) ++count;
  return !reader.isDamaged();
}

// Reads rows until the time of the slice is over. Returns SQLITE_ROW if there may be more rows,
// SQLITE_DONE after the last row, or an error. A step also loads the overflow pages of a long
// payload.
SqliteCode readSlice(Statement& rows, std::int64_t& last, std::uint64_t& count,
                     MessageBlockReader* blocks) {
  const auto end = Clock::now() + kSlice;
  SqliteCode code = SQLITE_ROW;
  while ((code = rows.step()) == SQLITE_ROW) {
    // Row numbers must grow. In a damaged table they may not grow, and the check would never end.
    if (rows.integer(0) <= last) return SQLITE_CORRUPT;
    last = rows.integer(0);
    if (blocks == nullptr) {
      ++count;
    } else if (!isSound(rows, *blocks, count)) {
      return SQLITE_CORRUPT;
    }
    if (Clock::now() >= end) break;
  }
  return code;
}

}  // namespace

void StoreCheck::begin(const std::string& file, const StoreExtent& extent, OnDamage onDamage) {
  // Stop the check of an earlier database. Its finding must not be taken for one about this
  // database.
  static_cast<void>(stop());
  records_ = 0;
  isChecked_ = false;
  try {
    thread_ = std::thread(
        [this, file, extent, onDamage = std::move(onDamage)] { run(file, extent, onDamage); });
  } catch (const std::system_error& error) {
    kLog.error("cannot check ", file, ": ", error.what(), kNotCheckedNow);
  }
}

bool StoreCheck::stop() {
  {
    const MutexLock lock(mutex_);
    isStopping_ = true;
  }
  stopping_.notifyAll();
  if (thread_.joinable()) thread_.join();
  const MutexLock lock(mutex_);
  isStopping_ = false;
  finding_.reset();
  return std::exchange(isChecked_, true);
}

std::optional<std::string> StoreCheck::finding() {
  const MutexLock lock(mutex_);
  return finding_;
}

void StoreCheck::run(const std::string& file, const StoreExtent& extent, const OnDamage& onDamage) {
  setUpThread("halvox-check");
  giveWayToOthers();
  kLog.info(
      "checking ", file,
      " in the background because the last run did not close it or did not finish checking it");
  Database database;
  std::string what;
  Outcome outcome = Outcome::kUnreadable;
  if (database.open(file, DatabaseAccess::kReadOnly) == SQLITE_OK) {
    // Wait for locks, which the writer may hold for a moment. A locked file must not be taken for a
    // damaged one.
    sqlite3_busy_timeout(database.get(), static_cast<int>(kBusyTimeout.count()));
    outcome = readAll(database, extent, what);
  } else {
    what = database.errorText();
  }
  switch (outcome) {
    case Outcome::kGoOn:
      isChecked_ = true;
      kLog.info("checked ", file, ": read ", records_, " records and found no damage");
      return;
    case Outcome::kStopped:
      return;
    case Outcome::kUnreadable:
      kLog.error("cannot check ", file, ": ", what, kNotCheckedNow);
      return;
    case Outcome::kDamaged:
      break;
  }
  {
    const MutexLock lock(mutex_);
    finding_ = what;
  }
  onDamage();
}

StoreCheck::Outcome StoreCheck::readAll(Database& database, const StoreExtent& extent,
                                        std::string& what) {
  // event_names is the only table with an index, which reading its rows would not check. One
  // statement is enough for the whole table, because there are few names.
  Statement names;
  SqliteCode code = database.prepare("PRAGMA quick_check(event_names)", names);
  if (code == SQLITE_OK) code = names.step();
  if (code == SQLITE_ROW && names.text(0) != "ok") {
    what = names.text(0);
    std::ranges::replace(what, '\n', ' ');
    return Outcome::kDamaged;
  }
  if (code != SQLITE_ROW) {
    what = database.errorText();
    return meansDamage(code) ? Outcome::kDamaged : Outcome::kUnreadable;
  }
  names = {};
  for (std::size_t kind = 0; kind < kKindTables.size(); ++kind) {
    const KindTables& tables = kKindTables[kind];
    for (const auto& [table, newest] :
         {std::pair{tables.records, extent.newest[kind]},
          std::pair{tables.spans, std::numeric_limits<std::int64_t>::max()}}) {
      const Outcome outcome = readTable(database, std::string(table), newest, what);
      if (outcome != Outcome::kGoOn) return outcome;
    }
  }
  return Outcome::kGoOn;
}

StoreCheck::Outcome StoreCheck::readTable(Database& database, const std::string& table,
                                          std::int64_t newest, std::string& what) {
  const bool hasBlocks = table == "message_blocks";
  std::uint64_t spans = 0;
  std::uint64_t& count = table.ends_with("_spans") ? spans : records_;
  MessageBlockReader blocks;
  Statement rows;
  SqliteCode code = database.prepare(
      "SELECT rowid, * FROM " + table + " WHERE rowid > ?1 AND rowid <= ?2 ORDER BY rowid", rows);
  if (code == SQLITE_OK) code = SQLITE_ROW;
  std::int64_t last = std::numeric_limits<std::int64_t>::min();
  while (code == SQLITE_ROW) {
    const auto begun = Clock::now();
    // Each slice is a new query that continues after the last row. Retention may have deleted rows
    // since the transaction of the previous slice has ended.
    rows.bind(1, last);
    rows.bind(2, newest);
    code = readSlice(rows, last, count, hasBlocks ? &blocks : nullptr);
    // Read the error before the reset, which may replace it.
    if (code != SQLITE_ROW && code != SQLITE_DONE) {
      what = table + ": " + (database.hasError() ? database.errorText() : "a row is damaged");
    }
    // End the transaction before the pause.
    rows.reset();
    if (!pause(Clock::now() - begun)) return Outcome::kStopped;
  }
  if (code == SQLITE_DONE) return Outcome::kGoOn;
  return meansDamage(code) ? Outcome::kDamaged : Outcome::kUnreadable;
}

bool StoreCheck::pause(Clock::duration length) {
  // Pause for as long as the slice took. Even on a slow disk, the check then uses at most half of
  // the disk's time.
  const auto until = Clock::now() + std::max<Clock::duration>(length, kShortestPause);
  const MutexLock lock(mutex_);
  while (!isStopping_ && stopping_.waitUntil(mutex_, until)) {
  }
  return !isStopping_;
}

}  // namespace halvox::platform::linux_
