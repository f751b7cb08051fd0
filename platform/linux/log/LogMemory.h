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

// The newest lines of the log, kept in memory for a capture of diagnostics whatever is written out.
// Bounded in lines and in bytes; the oldest lines make room. Adding copies the line into a ring
// that is there already: no allocation, a short lock.
// Any thread may add and read.
class LogMemory {
 public:
  struct Bounds {
    std::size_t lines = 10'000;
    std::size_t bytes = 4U << 20U;  // of the lines' texts
  };
  struct Contents {
    std::string text;         // the lines as a log file shows them, each with its end
    std::uint64_t lines = 0;  // in the text
    std::uint64_t added = 0;  // ever
  };

  // `level`: the least level that is kept.
  explicit LogMemory(LogLevel level) : LogMemory(level, Bounds{}) {}
  LogMemory(LogLevel level, Bounds bounds);

  [[nodiscard]] LogLevel level() const { return level_; }
  // Keeps a line. `line` may be the start of a longer one of `wholeLength` bytes; what is longer
  // than all the room is cut. The names in the entry must live as long as the log; its text is not
  // read.
  void add(const LogEntry& entry, std::string_view line);
  // The lines kept, oldest first. Formats them without holding anybody up.
  [[nodiscard]] Contents contents() const;

 private:
  // One line: its text is at `begin` in the ring, counted on over all rounds.
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
  // Both have their addresses from the beginning, and memory as far as lines have come.
  std::vector<Line> lines_ HALVOX_GUARDED_BY(mutex_);  // a ring once it is full
  std::unique_ptr<char[]> ring_ HALVOX_GUARDED_BY(mutex_);
  std::uint64_t firstLine_ HALVOX_GUARDED_BY(mutex_) = 0;
  std::uint64_t endLine_ HALVOX_GUARDED_BY(mutex_) = 0;
  std::uint64_t end_ HALVOX_GUARDED_BY(mutex_) = 0;  // where the next text begins
};

}  // namespace halvox::platform::linux_
