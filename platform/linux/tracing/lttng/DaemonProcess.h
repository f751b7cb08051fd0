#pragma once

#include <chrono>
#include <filesystem>
#include <optional>
#include <string>
#include <vector>

#include <sys/types.h>

namespace halvox::platform::linux_ {

// A tracer's daemon by its number and by when it started, as the kernel tells it: another process
// that gets the number later is never taken for it. A value; any thread may call.
struct DaemonProcess {
  pid_t pid = 0;
  std::string startTime{};

  // The process that has the number now. Its start time is empty when there is none.
  [[nodiscard]] static DaemonProcess withNumber(pid_t pid);
  // What `write` left in the file; none when it names no process.
  [[nodiscard]] static std::optional<DaemonProcess> read(const std::filesystem::path& noteFile);
  // False when the file cannot be written.
  [[nodiscard]] bool write(const std::filesystem::path& noteFile) const;

  // A process that has ended and that nobody waited for is not alive.
  [[nodiscard]] bool isAlive() const;
  // Ends the process by SIGTERM, or by SIGKILL when it has not ended within that time. Waits until
  // it is gone, at most twice that time.
  void end(std::chrono::milliseconds within) const;
};

// A program to start apart from ours: in a session of its own, so that a terminal does not end it
// before the traces are read, with signals that behave as usual, and with no descriptor of ours but
// these. None: /dev/null.
struct ProgramApart {
  std::vector<std::string> command;  // the program is searched for in PATH unless it has a slash
  int input = -1;
  int output = -1;
  enum class EndSignals : bool { kHeeded, kBlocked } endSignals = EndSignals::kHeeded;
};

// 0 and the process, or the system's error.
[[nodiscard]] int startApart(const ProgramApart& program, pid_t& pid);

}  // namespace halvox::platform::linux_
