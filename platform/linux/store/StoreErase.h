#pragma once

#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>
#include <span>
#include <string>
#include <utility>
#include <vector>

#include "platform/linux/base/Mutex.h"
#include "platform/linux/base/Result.h"
#include "platform/linux/store/EraseFiles.h"
#include "platform/linux/store/EraseSelection.h"
#include "platform/linux/store/RecordKind.h"
#include "platform/linux/store/Sqlite.h"
#include "platform/linux/store/StoreError.h"
#include "platform/linux/store/StoreOpening.h"
#include "platform/value.h"

namespace halvox::platform::linux_ {

// How an erasure is getting on, or how the last one ended.
struct EraseState {
  bool isRunning = false;
  std::uint64_t records = 0;  // erased so far; not counted if a time is erased
  std::uint64_t files = 0;
  bool isLogHeld = false;  // it waits for a reader that holds the write-ahead log
  std::string problem{};   // empty unless it failed
};

// The state as the interface com.tarno.halvox.Storage has it.
[[nodiscard]] Dictionary describe(const EraseState& state);

// Erases what belongs to one request so that none of its bytes remains in a file of the service:
// deletes records and files, gives free pages back, empties the write-ahead log and overwrites the
// unused space of all pages. Works in small steps, between which the writer stores records. What
// comes after begin() stays.
//
//   idle --begin()--> running --runOnce()...--> idle
//
// Owned by the store, or by eraseStore(). Any thread may call begin(), cancel() and state(); only
// the writer's thread calls the other functions.
class StoreErase {
 public:
  explicit StoreErase(ErasePlaces places) : places_(std::move(places)) {}

  // Returns false if an erasure runs already, or after cancel().
  bool begin(const EraseRequest& request) HALVOX_EXCLUDES(mutex_);
  // Ends an erasure that runs, because the store closes. Refuses further ones.
  void cancel() HALVOX_EXCLUDES(mutex_);
  [[nodiscard]] EraseState state() HALVOX_EXCLUDES(mutex_);

  [[nodiscard]] bool isRunning() HALVOX_EXCLUDES(mutex_);
  // Carries out one step, or returns at once if no erasure runs. After an error the caller rolls
  // back and calls fail().
  [[nodiscard]] SqliteCode runOnce(Database& database, std::span<RecordKind* const> kinds)
      HALVOX_EXCLUDES(mutex_);
  // Returns what an error of runOnce() means, for people.
  static std::string problemOf(SqliteCode code);
  // Undoes the setting of the connection that an erasure needs. Call it after an error was read.
  static void resetConnection(Database& database);
  // Ends the erasure that runs, with a problem.
  void fail(const std::string& problem) HALVOX_EXCLUDES(mutex_);
  // Forgets how far the erasure has come, before each closing of the database. It then begins anew.
  void release();

 private:
  struct Work;

  [[nodiscard]] SqliteCode prepare(Database& database) HALVOX_EXCLUDES(mutex_);
  [[nodiscard]] SqliteCode step(Database& database, std::span<RecordKind* const> kinds, bool& held);
  [[nodiscard]] SqliteCode visit(Database& database, std::span<RecordKind* const> kinds);
  [[nodiscard]] SqliteCode clean(Database& database, bool& held);

  const ErasePlaces places_;
  std::shared_ptr<Work> work_;  // writer only; none until the first step. Held by this alone.
  Mutex mutex_;
  EraseRequest request_ HALVOX_GUARDED_BY(mutex_);
  EraseState state_ HALVOX_GUARDED_BY(mutex_);
  bool isCancelled_ HALVOX_GUARDED_BY(mutex_) = false;
};

// Erases in a store that no service uses. Fails as vacuumStore() does. If a reader holds the log
// for some seconds, returns a state that is not complete. Calls `progress` after each step.
Result<EraseState, StoreError> eraseStore(const ErasePlaces& places, const StoreSizes& sizes,
                                          const EraseRequest& request,
                                          const std::function<void(const EraseState&)>& progress);

}  // namespace halvox::platform::linux_
