#pragma once

#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <thread>

#include "platform/linux/Mutex.h"
#include "platform/linux/store/Sqlite.h"
#include "platform/linux/store/StoreExtent.h"

namespace halvox::platform::linux_ {

// Reads through a database that an earlier run did not close, while the store already serves.
//
//   made --begin()--> reading --> sound, damaged or given up
//                        |
//                        +--stop()--> stopped
//
// A killed service leaves its database sound; a failing disk, a power cut or a stray program may
// not. Reading a large database takes minutes on a cold disk, so it runs on a thread of its own at
// low priority, in slices: every slice ends its transaction, because an open one would keep the
// write-ahead log from beginning anew, and is followed by a pause of its own length.
//
// It reads the records that were there when the database was opened; later ones were written by
// this run. Only damage is reported. A file that cannot be read at the moment is an error line, and
// the check is given up: the store meets such an error itself when it needs the page.
//
// Owned by the store. begin() and stop() are for the store's own threads, one at a time.
class StoreCheck {
 public:
  // Runs on the thread of the check, once, after finding() has its value. Must not call stop().
  using OnDamage = std::function<void()>;

  StoreCheck() = default;
  StoreCheck(const StoreCheck&) = delete;
  StoreCheck& operator=(const StoreCheck&) = delete;
  ~StoreCheck() { stop(); }

  // Stops a check that is running, and begins one of that file.
  void begin(const std::string& file, const StoreExtent& extent, OnDamage onDamage);
  // Blocks until the thread has ended: at most one slice. Forgets what was found.
  void stop();
  // What is damaged; none while nothing was found. Any thread.
  [[nodiscard]] std::optional<std::string> finding() HALVOX_EXCLUDES(mutex_);

 private:
  enum class Outcome : std::uint8_t { kGoOn, kStopped, kDamaged, kUnreadable };

  void run(const std::string& file, const StoreExtent& extent, const OnDamage& onDamage);
  [[nodiscard]] Outcome readAll(Database& database, const StoreExtent& extent, std::string& what);
  [[nodiscard]] Outcome readTable(Database& database, const std::string& table, std::int64_t newest,
                                  std::string& what);
  // False when the check is to stop.
  [[nodiscard]] bool pause(std::chrono::steady_clock::duration length) HALVOX_EXCLUDES(mutex_);

  std::thread thread_;
  std::uint64_t records_ = 0;  // read so far; the thread's
  Mutex mutex_;
  Condition stopping_;
  bool isStopping_ HALVOX_GUARDED_BY(mutex_) = false;
  std::optional<std::string> finding_ HALVOX_GUARDED_BY(mutex_);
};

}  // namespace halvox::platform::linux_
