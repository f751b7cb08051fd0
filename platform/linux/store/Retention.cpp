#include "platform/linux/store/Retention.h"

#include <algorithm>
#include <optional>
#include <string>
#include <string_view>
#include <utility>

namespace halvox::platform::linux_ {
namespace {

constexpr std::chrono::minutes kAgeInterval{1};
// The largest number of steps in one transaction. It is bounded because waiting records must not be
// held up for long. A step by age covers one span (512 records) or one block of messages of each
// kind. A step by size deletes 64 records, or one block of messages. 128 steps usually delete 8,192
// records or more, twice as many as one transaction can add. Retention therefore keeps up with any
// rate of writing.
constexpr int kAgeSteps = 16;
constexpr int kSizeSteps = 128;
// How much retention deletes in advance when the database is full: 1/kShareAhead of the largest
// size, but at most kMostAhead bytes.
constexpr std::uint64_t kShareAhead = 16;
constexpr std::uint64_t kMostAhead = std::uint64_t{2} << 20U;
constexpr std::uint64_t kLeastPage = 512;  // SQLite's smallest page

SqliteCode readInteger(Statement& statement, std::uint64_t& value) {
  const SqliteCode code = statement.step();
  if (code == SQLITE_ROW) value = static_cast<std::uint64_t>(statement.integer(0));
  statement.reset();
  return code == SQLITE_ROW ? SQLITE_OK : code;
}

// Deletes from the kind that has the oldest record of all. A flood of one kind therefore displaces
// only records that are older than its own, never newer records of another kind.
SqliteCode deleteOldest(std::span<RecordKind* const> kinds, bool& found) {
  RecordKind* oldest = nullptr;
  double oldestTime = 0;
  for (RecordKind* const kind : kinds) {
    std::optional<double> time;
    const SqliteCode code = kind->oldestTime(time);
    if (code != SQLITE_OK) return code;
    if (!time.has_value() || (oldest != nullptr && *time >= oldestTime)) continue;
    oldest = kind;
    oldestTime = *time;
  }
  found = false;
  return oldest == nullptr ? SQLITE_OK : oldest->deleteOldest(found);
}

// Runs one step for each kind. Sets `found` to whether the step of any kind found records.
template <typename Step>
SqliteCode stepAll(std::span<RecordKind* const> kinds, bool& found, Step step) {
  found = false;
  for (RecordKind* const kind : kinds) {
    bool foundOfKind = false;
    const SqliteCode code = step(*kind, foundOfKind);
    if (code != SQLITE_OK) return code;
    found = found || foundOfKind;
  }
  return SQLITE_OK;
}

}  // namespace

SqliteCode Retention::prepare(Database& database) {
  // Read the size of a page from SQLite, because a database that another program made may have
  // another page size than ours.
  pageBytes_ = static_cast<std::uint64_t>(database.queryInteger("PRAGMA page_size").value_or(0));
  // Vacuum moves pages, and each moved page is written to the write-ahead log. Move so few pages at
  // a time that the log does not outgrow its limit.
  const std::uint64_t vacuumPages =
      limits_.transactionBytes / (2 * std::max(pageBytes_, kLeastPage));
  const std::string vacuum = "PRAGMA incremental_vacuum(" + std::to_string(vacuumPages) + ")";
  for (const auto& [statement, sql] :
       {std::pair<Statement*, std::string_view>{&statements_.begin, "BEGIN IMMEDIATE"},
        {&statements_.commit, "COMMIT"},
        {&statements_.pages, "PRAGMA page_count"},
        {&statements_.freePages, "PRAGMA freelist_count"},
        {&statements_.vacuum, vacuum},
        {&statements_.checkpoint, "PRAGMA wal_checkpoint(PASSIVE)"}}) {
    const SqliteCode code = database.prepare(sql, *statement);
    if (code != SQLITE_OK) return code;
  }
  return SQLITE_OK;
}

void Retention::release() { statements_ = {}; }

SqliteCode Retention::runOnce(double now, std::span<RecordKind* const> kinds, bool& more) {
  more = false;
  const bool byAge = std::chrono::steady_clock::now() >= nextByAge_;
  SqliteCode code = readUse();
  if (code != SQLITE_OK) return code;
  // Usually nothing is to be deleted. Return without a transaction then, because this function runs
  // after every transaction of the store.
  if (!byAge && !isFull() && fileBytes() <= limits_.databaseBytes) return SQLITE_OK;

  const std::uint64_t before = fileBytes();
  code = statements_.begin.run();
  if (code != SQLITE_OK) return code;
  if (byAge) code = deleteAged(now, kinds, more);
  if (code == SQLITE_OK) code = deleteForSize(kinds, more);
  if (code == SQLITE_OK) code = shrinkFile(more);
  if (code == SQLITE_OK) code = statements_.commit.run();
  if (code != SQLITE_OK) return code;
  // The file becomes shorter only when the log is copied into it.
  const bool hasShrunk = fileBytes() < before;
  // Copy the log only once, at the end of a series of steps.
  return hasShrunk && !more ? statements_.checkpoint.run() : SQLITE_OK;
}

bool Retention::isFull(std::uint64_t more) const {
  // Keep space free for the payload of one transaction, and a quarter more for what pages hold in
  // addition to payloads. The next transaction then fills free pages, and the file does not grow.
  const std::uint64_t reserve = limits_.transactionBytes + limits_.transactionBytes / 4;
  return (pages_ - freePages_) * pageBytes_ + reserve + more > limits_.databaseBytes;
}

SqliteCode Retention::readUse() {
  const SqliteCode code = readInteger(statements_.pages, pages_);
  return code == SQLITE_OK ? readInteger(statements_.freePages, freePages_) : code;
}

SqliteCode Retention::deleteAged(double now, std::span<RecordKind* const> kinds, bool& more) {
  const double cutoff = now - static_cast<double>(limits_.age.count());
  for (int step = 0; step < kAgeSteps; ++step) {
    bool found = false;
    const SqliteCode code = stepAll(kinds, found, [&](RecordKind& kind, bool& foundOfKind) {
      return kind.deleteOlderThan(cutoff, foundOfKind);
    });
    if (code != SQLITE_OK) return code;
    if (!found) {
      // Wait for kAgeInterval only if nothing remains to be deleted. Otherwise the next call
      // continues at once.
      nextByAge_ = std::chrono::steady_clock::now() + kAgeInterval;
      return SQLITE_OK;
    }
  }
  more = true;
  return SQLITE_OK;
}

SqliteCode Retention::deleteForSize(std::span<RecordKind* const> kinds, bool& more) {
  // Delete enough for several transactions at once. A deletion writes pages of tables and of the
  // list of free pages, and deletions of neighbouring blocks write the same pages.
  const std::uint64_t ahead = std::min(limits_.databaseBytes / kShareAhead, kMostAhead);
  SqliteCode code = readUse();
  if (code != SQLITE_OK || !isFull()) return code;
  for (int step = 0; step < kSizeSteps; ++step) {
    code = readUse();
    // Measure again after each step, because the deleted records may be large or small.
    if (code != SQLITE_OK || !isFull(ahead)) return code;
    bool found = false;
    code = deleteOldest(kinds, found);
    if (code != SQLITE_OK || !found) return code;
  }
  more = true;
  return SQLITE_OK;
}

SqliteCode Retention::shrinkFile(bool& more) {
  SqliteCode code = readUse();
  if (code != SQLITE_OK || fileBytes() <= limits_.databaseBytes || freePages_ == 0) return code;
  code = statements_.vacuum.run();
  if (code == SQLITE_OK) code = readUse();
  more = more || (fileBytes() > limits_.databaseBytes && freePages_ > 0);
  return code;
}

}  // namespace halvox::platform::linux_
