#pragma once

#include <chrono>
#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

#include "platform/linux/log/LogQueue.h"

namespace halvox::platform::linux_ {

// The longest text of a line, in bytes after escaping. Clients choose parts of lines. A message of
// a megabyte must not become a line of a megabyte.
inline constexpr std::size_t kLongestLogLine = 8192;

// Appends the text of an entry, escaped so that it stays on one line. Cuts it at kLongestLogLine
// and appends the number of missing bytes.
void appendLogLineText(std::string& line, const LogEntry& entry);

// Formats entries as lines of text in local time, each with its end:
//   2024-05-01T12:00:00.123+02:00 error [com.tarno.halvox:hvrs] the line
// The time is local, because readers compare the log with what users report. It has its offset,
// because files of several machines are merged. Belongs to one thread.
class LogLineFormatter {
 public:
  // Valid until the next call.
  [[nodiscard]] std::string_view format(const LogEntry& entry);

 private:
  void setSecond(std::chrono::sys_seconds second);

  std::optional<std::chrono::sys_seconds> second_;  // which the two texts below belong to
  std::string secondText_;
  std::string zoneText_;
  std::string line_;
};

}  // namespace halvox::platform::linux_
