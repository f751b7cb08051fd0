#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <optional>
#include <span>
#include <string>
#include <utility>

#include "platform/linux/base/Mutex.h"
#include "platform/linux/base/Result.h"
#include "platform/linux/store/RecordKind.h"
#include "platform/linux/store/Retention.h"
#include "platform/linux/store/Sqlite.h"
#include "platform/linux/store/StoreError.h"
#include "platform/linux/store/StoreOpening.h"
#include "platform/value.h"

namespace halvox::platform::linux_ {

// The least size that a request from outside may name, in bytes. An empty database is smaller.
constexpr std::uint64_t kLeastVacuumBytes = std::uint64_t{1} << 20U;

// What to delete on demand. With neither limit, only free pages are given back.
struct VacuumRequest {
  std::optional<double> before{};          // delete older records; seconds since 1970
  std::optional<std::uint64_t> toBytes{};  // then the oldest, until the database file has this size
};

// How a vacuum is getting on, or how the last one ended.
struct VacuumState {
  bool isRunning = false;
  std::uint64_t bytesBefore = 0;  // database and write-ahead log together
  std::uint64_t bytes = 0;
  bool isLogHeld = false;  // a reader keeps the write-ahead log; SQLite empties it later
  std::string problem{};   // empty unless it failed
};

// The state as the interface com.tarno.halvox.Storage has it.
[[nodiscard]] Dictionary describe(const VacuumState& state);

// Deletes records and gives their space back, as retention does but with the limits of one request.
// Works in small transactions, between which the writer stores records.
//
//   idle --begin()--> running --runOnce()...--> idle
//
// Owned by the store, or by vacuumStore(). Any thread may call begin(), cancel() and state(); only
// the writer's thread calls the other functions.
class StoreVacuum {
 public:
  explicit StoreVacuum(std::filesystem::path database) : database_(std::move(database)) {}

  // Returns false if a vacuum runs already, or after cancel().
  bool begin(const VacuumRequest& request) HALVOX_EXCLUDES(mutex_);
  // Ends a vacuum that runs, because the store closes. Refuses further ones.
  void cancel() HALVOX_EXCLUDES(mutex_);
  [[nodiscard]] VacuumState state() HALVOX_EXCLUDES(mutex_);

  [[nodiscard]] bool isRunning() HALVOX_EXCLUDES(mutex_);
  // Carries out one step, or returns at once if no vacuum runs. After an error the caller calls
  // fail(). The database's own error text is then that of the rollback.
  [[nodiscard]] SqliteCode runOnce(Database& database, std::span<RecordKind* const> kinds)
      HALVOX_EXCLUDES(mutex_);
  // Ends the vacuum that runs, with a problem.
  void fail(const std::string& problem) HALVOX_EXCLUDES(mutex_);
  // Finalizes all statements, before each closing of the database.
  void release() { step_.reset(); }

 private:
  // The step of deleting, of shrinking the file and of emptying its log.
  struct Step {
    Retention retention;
    double before;  // Retention deletes what is older than that; 0: nothing is
    bool isDeleting = true;
  };

  [[nodiscard]] SqliteCode prepare(Database& database);
  [[nodiscard]] SqliteCode finish(Database& database) HALVOX_EXCLUDES(mutex_);
  void noteBytes() HALVOX_EXCLUDES(mutex_);

  const std::filesystem::path database_;
  std::optional<Step> step_;  // writer only; none until the statements of the vacuum are prepared
  Mutex mutex_;
  VacuumRequest request_ HALVOX_GUARDED_BY(mutex_);
  VacuumState state_ HALVOX_GUARDED_BY(mutex_);
  bool isCancelled_ HALVOX_GUARDED_BY(mutex_) = false;
};

// Vacuums a store that no service uses. Takes the service's lock on the store: fails with kInUse if
// a service runs, and a service that starts meanwhile ends with the same failure. First checks a
// database that its service did not close, and leaves a damaged one as it is. Calls `progress`
// after each step. Blocks on the disk.
Result<VacuumState, StoreError> vacuumStore(
    const std::filesystem::path& directory, const StoreSizes& sizes, const VacuumRequest& request,
    const std::function<void(const VacuumState&)>& progress);

}  // namespace halvox::platform::linux_
