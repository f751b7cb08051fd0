#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/base/Mutex.h"
#include "platform/log.h"

namespace halvox::platform::linux_ {

// One line on its way to the reader of the log. The names belong to the category, which lives as
// long as the log.
struct LogEntry {
  std::chrono::system_clock::time_point time;
  LogLevel level = LogLevel::kDefault;
  std::string_view subsystem;
  std::string_view category;
  std::string text;             // as the caller gave it, its start only when it is very long
  std::size_t wholeLength = 0;  // of what the caller gave, in bytes
};

// Lines between those who log and the one thread that writes, bounded in bytes. When the writer
// falls behind, new lines are refused; a part of the room is kept for errors.
// Any thread may add; one thread takes.
class LogQueue {
 public:
  // False when there is no room, or after the end.
  bool add(LogEntry entry);
  // Takes all that has come; waits while there is nothing. False once the end has come and all has
  // been taken.
  bool take(std::vector<LogEntry>& entries);
  // No more lines are taken in; the taker wakes up.
  void end();

 private:
  Mutex mutex_;
  Condition wakeUp_;
  std::vector<LogEntry> entries_ HALVOX_GUARDED_BY(mutex_);
  std::size_t bytes_ HALVOX_GUARDED_BY(mutex_) = 0;
  bool hasEnded_ HALVOX_GUARDED_BY(mutex_) = false;
};

}  // namespace halvox::platform::linux_
