#pragma once

#include <chrono>
#include <filesystem>
#include <optional>
#include <string>

#include <sys/types.h>

namespace halvox::platform::linux_ {

// Identifies a process by its ID and its start time, both from the kernel. The kernel reuses IDs,
// and a signal must not reach another process that got the ID later.
//
// A plain value. Any thread may call.
struct DaemonProcess {
  pid_t pid = 0;
  std::string startTime{};

  // The process that has this ID now. The start time is empty if there is none.
  [[nodiscard]] static DaemonProcess withNumber(pid_t pid);
  // The process that `write` noted in the file; none if the file names no process.
  [[nodiscard]] static std::optional<DaemonProcess> read(const std::filesystem::path& noteFile);
  // Notes the process in the file. Returns false if the file cannot be written.
  [[nodiscard]] bool write(const std::filesystem::path& noteFile) const;

  // A process that has ended does not count as alive, even if its parent has not waited for it.
  [[nodiscard]] bool isAlive() const;
  // Ends the process with SIGTERM, and with SIGKILL if it has not ended in time. Blocks until it
  // has ended, but no longer than twice the time.
  void end(std::chrono::milliseconds within) const;
};

}  // namespace halvox::platform::linux_
