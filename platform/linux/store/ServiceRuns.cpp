#include "platform/linux/store/ServiceRuns.h"

#include <array>
#include <utility>

#include "platform/linux/base/WholeFile.h"

namespace halvox::platform::linux_ {
namespace {

// How many runs the database keeps. A row has about 100 bytes.
constexpr std::int64_t kKeptRuns = 1000;
// What an answered message may wait for its commit.
constexpr double kLongestWait = 0.5;

constexpr std::array kEndings{RunEnding::kClean, RunEnding::kCrash, RunEnding::kPowerCut,
                              RunEnding::kUnknown};

}  // namespace

std::string_view endingName(RunEnding ending) {
  switch (ending) {
    case RunEnding::kClean:
      return "clean";
    case RunEnding::kCrash:
      return "crash";
    case RunEnding::kPowerCut:
      return "power cut";
    case RunEnding::kUnknown:
      return "unknown";
  }
  return {};
}

Dictionary lastRunPayload(const LastRun& run) {
  Dictionary payload{{"run", run.number},
                     {"end", std::string(endingName(run.ending))},
                     {"start", run.startTime},
                     {"last_commit", run.lastCommit}};
  // After a power cut, more than that may be missing: all that the disk had not written yet.
  if (run.ending == RunEnding::kCrash) payload.set("missing_seconds", kLongestWait);
  return payload;
}

std::string currentBootID() {
  constexpr std::size_t kMost = 64;
  FileContent file = readWholeFile({.path = "/proc/sys/kernel/random/boot_id", .most = kMost});
  if (!file.isRead()) return {};
  std::string& text = file.bytes;
  while (!text.empty() && text.back() == '\n') text.pop_back();
  return std::move(text);
}

ServiceRuns::ServiceRuns(const ClockService& clock, std::string bootID)
    : clock_(clock), bootID_(std::move(bootID)), startTime_(clock.currentDate().secondsSince1970) {}

SqliteCode ServiceRuns::prepare(Database& database) {
  for (const auto& [statement, sql] :
       {std::pair<Statement*, std::string_view>{
            &insert_, "INSERT INTO run_records VALUES (?1, ?2, ?3, ?4, NULL)"},
        {&update_, "UPDATE run_records SET last_commit = ?2, ending = ?3 WHERE id = ?1"},
        {&endLast_, "UPDATE run_records SET ending = ?2 WHERE id = ?1"},
        {&deleteOld_, "DELETE FROM run_records WHERE id <= ?1"}}) {
    const SqliteCode code = database.prepare(sql, *statement);
    if (code != SQLITE_OK) return code;
  }
  return readLast(database);
}

void ServiceRuns::release() {
  insert_ = {};
  update_ = {};
  endLast_ = {};
  deleteOld_ = {};
}

SqliteCode ServiceRuns::readLast(Database& database) {
  Statement newest;
  SqliteCode code = database.prepare(
      "SELECT id, boot_id, start_time, last_commit, ifnull(ending, '') FROM run_records"
      " ORDER BY id DESC LIMIT 1",
      newest);
  if (code == SQLITE_OK) code = newest.step();
  if (code != SQLITE_ROW && code != SQLITE_DONE) return code;
  const bool hasRow = code == SQLITE_ROW;
  // The database may be open for the second time in this run, because of an error, or it may be a
  // new one that takes the place of a damaged one.
  isNoted_ = isNoted_ && hasRow && newest.integer(0) == number_ && newest.real(2) == startTime_;
  if (isNoted_) return SQLITE_OK;
  last_.reset();
  number_ = hasRow ? newest.integer(0) + 1 : 1;
  if (hasRow) {
    last_ = LastRun{.number = newest.integer(0),
                    .ending = endingOf(newest.text(4), newest.text(1)),
                    .startTime = newest.real(2),
                    .lastCommit = newest.real(3)};
  }
  return SQLITE_OK;
}

RunEnding ServiceRuns::endingOf(std::string_view ending, std::string_view bootID) const {
  for (const RunEnding one : kEndings) {
    if (ending == endingName(one)) return one;
  }
  if (bootID.empty() || bootID_.empty()) return RunEnding::kUnknown;
  return bootID == bootID_ ? RunEnding::kCrash : RunEnding::kPowerCut;
}

SqliteCode ServiceRuns::insert(double now) {
  insert_.bind(1, number_);
  insert_.bind(2, std::string_view(bootID_));
  insert_.bind(3, startTime_);
  insert_.bind(4, now);
  SqliteCode code = insert_.run();
  if (code == SQLITE_OK && last_.has_value()) {
    endLast_.bind(1, last_->number);
    endLast_.bind(2, endingName(last_->ending));
    code = endLast_.run();
  }
  if (code != SQLITE_OK) return code;
  deleteOld_.bind(1, number_ - kKeptRuns);
  return deleteOld_.run();
}

SqliteCode ServiceRuns::write() {
  const double now = clock_.currentDate().secondsSince1970;
  if (!isNoted_) {
    const SqliteCode code = insert(now);
    if (code != SQLITE_OK || !isFinishing_) return code;
  }
  update_.bind(1, number_);
  update_.bind(2, now);
  isFinishing_ ? update_.bind(3, endingName(RunEnding::kClean)) : update_.bindNull(3);
  return update_.run();
}

void ServiceRuns::onCommitted() {
  isNoted_ = true;
  isFinishing_ = false;
}

}  // namespace halvox::platform::linux_
