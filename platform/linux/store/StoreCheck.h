#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <thread>

#include "platform/linux/base/Mutex.h"
#include "platform/linux/store/Sqlite.h"
#include "platform/linux/store/StoreExtent.h"

namespace halvox::platform::linux_ {

// Checks a database that an earlier run did not close, while the store already uses it.
//
//   made --begin()--> reading --> sound, damaged or given up
//                        |
//                        +--stop()--> stopped
//
// A killed service leaves its database sound, but a failing disk, a power cut or another program
// may have damaged it. Reading a large database takes minutes if it is not in the page cache. A
// thread of its own, with low priority, therefore reads the database in slices. Each slice ends its
// transaction, because an open transaction would keep the writer from reusing the write-ahead log.
// After each slice the thread pauses for as long as the slice took.
//
// Reads only the records that existed when the database was opened, because this run has written
// the later ones. Reports only damage. If the file cannot be read for another reason, logs an error
// and gives up, because the store notices such an error itself when it needs the page. The store
// repeats an unfinished check when it opens the database the next time.
//
// Owned by the store. Only the store's own threads call begin() and stop(), one at a time.
class StoreCheck {
 public:
  // Called at most once, on the thread of the check, when finding() has a value. Must not call
  // stop(), which waits for that thread.
  using OnDamage = std::function<void()>;

  StoreCheck() = default;
  StoreCheck(const StoreCheck&) = delete;
  StoreCheck& operator=(const StoreCheck&) = delete;
  ~StoreCheck() { static_cast<void>(stop()); }

  // Stops a running check and starts to check `file`. If no thread can be started, logs an error
  // and gives up.
  void begin(const std::string& file, const StoreExtent& extent, OnDamage onDamage);
  // Ends the thread and clears finding(). Blocks for at most one slice. Returns false if the check
  // was not finished and must be repeated. Further calls do nothing and return true.
  bool stop();
  // Any thread. Returns a description of the damage; std::nullopt while none was found.
  [[nodiscard]] std::optional<std::string> finding() HALVOX_EXCLUDES(mutex_);

 private:
  enum class Outcome : std::uint8_t { kGoOn, kStopped, kDamaged, kUnreadable };

  void run(const std::string& file, const StoreExtent& extent, const OnDamage& onDamage);
  [[nodiscard]] Outcome readAll(Database& database, const StoreExtent& extent, std::string& what);
  [[nodiscard]] Outcome readTable(Database& database, const std::string& table, std::int64_t newest,
                                  std::string& what);
  // Returns false when the check must stop.
  [[nodiscard]] bool pause(std::chrono::steady_clock::duration length) HALVOX_EXCLUDES(mutex_);

  std::thread thread_;
  // Used by the thread of the check, and by other threads only after that thread has ended.
  std::uint64_t records_ = 0;  // read so far
  bool isChecked_ = true;      // nothing is left to check
  Mutex mutex_;
  Condition stopping_;
  bool isStopping_ HALVOX_GUARDED_BY(mutex_) = false;
  std::optional<std::string> finding_ HALVOX_GUARDED_BY(mutex_);
};

}  // namespace halvox::platform::linux_
