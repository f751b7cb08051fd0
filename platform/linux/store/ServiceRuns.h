#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/clock.h"
#include "platform/linux/store/Sqlite.h"
#include "platform/value.h"

namespace halvox::platform::linux_ {

// How a run of the service ended.
enum class RunEnding : std::uint8_t {
  kClean,     // it closed the store
  kCrash,     // its process ended without closing the store, and the system has not restarted since
  kPowerCut,  // the same, but the system has restarted since: a power cut, or a crash of the system
  kUnknown,   // it did not close the store, and it is not known whether the system has restarted
};
// Returns the text in the database and in the event, such as "power cut".
[[nodiscard]] std::string_view endingName(RunEnding ending);

// The run before this one, as this one found it.
struct LastRun {
  std::int64_t number = 0;
  RunEnding ending = RunEnding::kUnknown;
  double startTime = 0;   // seconds since 1970
  double lastCommit = 0;  // of the last transaction that the database has
};

// The event that says how a run ended that did not close the store, and what it may have lost.
inline constexpr std::string_view kLastRunEvent = "com.tarno.reporting.lastrun";
[[nodiscard]] Dictionary lastRunPayload(const LastRun& run);

// Returns the identifier of this start of the system; empty if the system does not give it.
[[nodiscard]] std::string currentBootID();

// Notes each run of the service in the table `run_records`, so that the next run can tell how this
// one ended. The row of a run has no ending until it closes the store. A row without an ending that
// the next run finds belongs to a run that was killed, and its boot ID shows whether the system has
// restarted since.
//
//   opened --write--> noted --write (each transaction)--> ... --finish(), write--> ended
//
// Owned by the store. After open() only the writer's thread uses it.
class ServiceRuns {
 public:
  // Does not own `clock`, which must outlive it.
  ServiceRuns(const ClockService& clock, std::string bootID);

  // Prepares the statements and reads how the last run ended, after each opening of the database.
  [[nodiscard]] SqliteCode prepare(Database& database);
  // Finalizes all statements, before each closing of the database.
  void release();

  // The run before this one; std::nullopt if the database knows none. Valid after prepare().
  [[nodiscard]] const std::optional<LastRun>& last() const { return last_; }
  // Returns true if this run must be written even if there is no record: it is not in the database
  // yet, or has ended.
  [[nodiscard]] bool mustWrite() const { return !isNoted_ || isFinishing_; }
  // Returns false until this run is in the database. Until then, a power cut must not undo the
  // transaction: the next run would take the end of this one for that of the run before.
  [[nodiscard]] bool isNoted() const { return isNoted_; }
  // The next write() also writes that this run has closed the store.
  void finish() { isFinishing_ = true; }

  // Writes this run and the time into the open transaction.
  [[nodiscard]] SqliteCode write();
  void onCommitted();

 private:
  [[nodiscard]] SqliteCode readLast(Database& database);
  [[nodiscard]] RunEnding endingOf(std::string_view ending, std::string_view bootID) const;
  [[nodiscard]] SqliteCode insert(double now);

  const ClockService& clock_;
  const std::string bootID_;
  const double startTime_;
  Statement insert_;
  Statement update_;
  Statement endLast_;
  Statement deleteOld_;
  std::optional<LastRun> last_;
  std::int64_t number_ = 0;
  bool isNoted_ = false;
  bool isFinishing_ = false;
};

}  // namespace halvox::platform::linux_
