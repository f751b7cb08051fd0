#pragma once

#include <chrono>
#include <filesystem>
#include <optional>
#include <string>
#include <vector>

#include <sys/types.h>

namespace halvox::platform::linux_ {

// Identifies a process by its number and its start time, both from the kernel. The kernel reuses
// numbers, and a signal must not reach another process that got the number later.
//
// A plain value. Any thread may call.
struct DaemonProcess {
  pid_t pid = 0;
  std::string startTime{};

  // The process that has the number now. The start time is empty if there is none.
  [[nodiscard]] static DaemonProcess withNumber(pid_t pid);
  // The process that `write` noted in the file; none if the file names no process.
  [[nodiscard]] static std::optional<DaemonProcess> read(const std::filesystem::path& noteFile);
  // Notes the process in the file. Returns false if the file cannot be written.
  [[nodiscard]] bool write(const std::filesystem::path& noteFile) const;

  // A process that has ended but that its parent has not waited for does not count as alive.
  [[nodiscard]] bool isAlive() const;
  // Ends the process with SIGTERM, and with SIGKILL if it has not ended in time. Blocks until it
  // has ended, at most for twice the time.
  void end(std::chrono::milliseconds within) const;
};

// How to start a program independent of ours: in a session of its own, because a Ctrl-C in the
// service's terminal must not end the tracer before the traces are read; with default signal
// handling, because our threads block signals; and with no descriptor of ours except these. -1
// stands for /dev/null.
struct ProgramApart {
  std::vector<std::string> command;  // the program is searched for in PATH unless it has a slash
  int input = -1;
  int output = -1;
  enum class EndSignals : bool { kHeeded, kBlocked } endSignals = EndSignals::kHeeded;
};

// Returns 0 and sets `pid`, or returns the system's error.
[[nodiscard]] int startApart(const ProgramApart& program, pid_t& pid);

}  // namespace halvox::platform::linux_
