#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include <sys/types.h>

namespace halvox::platform::linux_ {

// Fields of /proc/<pid>/stat. See proc(5).
struct ProcessStat {
  char state = '?';            // field 3: 'Z' has ended, but its parent has not waited for it
  std::uint64_t startTicks{};  // field 22: clock ticks from the system's start to the process's
};

// Parses the text of such a file. Returns std::nullopt if the text is malformed or ends before the
// end of the start time. The command name in it may contain blanks, parentheses and line ends,
// because each process chooses its own name.
[[nodiscard]] std::optional<ProcessStat> parseProcessStat(std::string_view text);

// Reads the file of a process. Returns std::nullopt if the process does not exist. Does not block.
// Any thread may call it.
[[nodiscard]] std::optional<ProcessStat> readProcessStat(pid_t pid);

// Reads the file of this process. Also correct if /proc shows the processes of another PID
// namespace, where this process has another number than getpid() returns.
[[nodiscard]] std::optional<ProcessStat> readOwnProcessStat();

}  // namespace halvox::platform::linux_
