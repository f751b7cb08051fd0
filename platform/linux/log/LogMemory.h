#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/base/Mutex.h"
#include "platform/linux/log/LogQueue.h"
#include "platform/log.h"

namespace halvox::platform::linux_ {

// Keeps the newest lines of the log in memory for captures of diagnostics, at a level of its own.
// Bounded in lines and in bytes. When a bound is reached, a new line replaces the oldest ones.
// Adding a line copies it into a ring that was allocated at the start, under a short lock. Threads:
// any may add and read. Owner: the log service.
class LogMemory {
 public:
  struct Bounds {
    std::size_t lines = 10'000;
    std::size_t bytes = 4U << 20U;  // of the texts
  };
  struct Contents {
    std::string text;         // the lines as a log file shows them, each with its end
    std::uint64_t lines = 0;  // in the text
    std::uint64_t added = 0;  // since the start, including replaced lines
  };

  // Keeps lines of `level` and above.
  explicit LogMemory(LogLevel level) : LogMemory(level, Bounds{}) {}
  LogMemory(LogLevel level, Bounds bounds);

  [[nodiscard]] LogLevel level() const { return level_; }
  // Keeps `line`, which may be the start of a text of `entry.wholeLength` bytes; cuts it at
  // `bounds.bytes`. Ignores `entry.text`. The names in the entry must live as long as the log.
  void add(const LogEntry& entry, std::string_view line);
  // The kept lines, oldest first. Copies them under the lock and formats the copies after releasing
  // it, so that a capture does not delay threads that log.
  [[nodiscard]] Contents contents() const;

 private:
  // `begin` counts bytes since the start; the text is at `begin` modulo the size of the ring.
  struct Line {
    std::chrono::system_clock::time_point time;
    std::string_view subsystem;
    std::string_view category;
    std::uint64_t begin = 0;
    std::size_t length = 0;
    std::size_t wholeLength = 0;
    LogLevel level = LogLevel::kDefault;
  };

  const LogLevel level_;
  const Bounds bounds_;
  mutable Mutex mutex_;
  // `lines_` and `ring_` reserve their whole address range at the start. The kernel provides the
  // memory only as lines arrive.
  std::vector<Line> lines_ HALVOX_GUARDED_BY(mutex_);  // a ring once it is full
  std::unique_ptr<char[]> ring_ HALVOX_GUARDED_BY(mutex_);
  std::uint64_t firstLine_ HALVOX_GUARDED_BY(mutex_) = 0;
  std::uint64_t endLine_ HALVOX_GUARDED_BY(mutex_) = 0;
  std::uint64_t end_ HALVOX_GUARDED_BY(mutex_) =
      0;  // where the next text begins, counted like `begin`
};

}  // namespace halvox::platform::linux_
