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

// One line on its way to the reader of the log. The category owns the names and lives as long as
// the log.
struct LogEntry {
  std::chrono::system_clock::time_point time;
  LogLevel level = LogLevel::kDefault;
  std::string_view subsystem;
  std::string_view category;
  std::string text;             // unescaped; only its start, if it is longer than kLongestLogLine
  std::size_t wholeLength = 0;  // bytes that the caller logged
};

// The queue between the threads that log and the one thread that writes. Bounded in bytes: when the
// writer is too slow, new lines are refused, and the last part of the queue takes only errors. It
// refuses new lines rather than dropping old ones, because the first lines of a burst usually name
// its cause.
// Threads: any may add; one takes. Owner: the log service.
class LogQueue {
 public:
  // Returns false if the queue is full, or after end(). Never blocks for long.
  bool add(LogEntry entry);
  // Replaces `entries` with all queued lines; waits while there are none. Returns false after
  // end(), once all lines were taken.
  bool take(std::vector<LogEntry>& entries);
  // Refuses further lines and wakes the thread that takes lines.
  void end();

 private:
  Mutex mutex_;
  Condition wakeUp_;
  std::vector<LogEntry> entries_ HALVOX_GUARDED_BY(mutex_);
  std::size_t bytes_ HALVOX_GUARDED_BY(mutex_) = 0;
  bool hasEnded_ HALVOX_GUARDED_BY(mutex_) = false;
};

}  // namespace halvox::platform::linux_
