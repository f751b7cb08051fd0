#include "platform/linux/tracing/lttng/DaemonProcess.h"

#include <csignal>
#include <fstream>
#include <thread>

#include "platform/linux/base/WholeFile.h"

namespace halvox::platform::linux_ {
namespace {

// The process is not our child, so there is nothing to wait on.
constexpr std::chrono::milliseconds kLookEvery{10};

std::string startTimeOf(pid_t pid) {
  const std::string path = "/proc/" + std::to_string(pid) + "/stat";
  const std::string text = readWholeFile({.path = path.c_str(), .most = 4096}).bytes;
  // The process name may contain anything, and ends at the last ")". The start time is field 22.
  const std::size_t name = text.rfind(')');
  if (name == std::string::npos) return {};
  constexpr int kFieldsBetween = 20;
  std::size_t at = name;
  for (int field = 0; field < kFieldsBetween && at != std::string::npos; ++field) {
    at = text.find(' ', at + 1);
  }
  // A zombie has ended and only waits for its parent.
  if (at == std::string::npos || text.compare(name, 3, ") Z") == 0) return {};
  return text.substr(at + 1, text.find(' ', at + 1) - at - 1);
}

}  // namespace

DaemonProcess DaemonProcess::withNumber(pid_t pid) {
  return {.pid = pid, .startTime = startTimeOf(pid)};
}

std::optional<DaemonProcess> DaemonProcess::read(const std::filesystem::path& noteFile) {
  DaemonProcess process;
  std::ifstream file(noteFile);
  if (!(file >> process.pid >> process.startTime) || process.pid <= 1) return std::nullopt;
  return process;
}

bool DaemonProcess::write(const std::filesystem::path& noteFile) const {
  std::ofstream file(noteFile);
  file << pid << ' ' << startTime << '\n';
  // Before the check: the bytes reach the file only now.
  file.close();
  return !file.fail();
}

bool DaemonProcess::isAlive() const { return !startTime.empty() && startTimeOf(pid) == startTime; }

void DaemonProcess::end(std::chrono::milliseconds within) const {
  // SIGTERM first: the daemon then ends its consumer and removes its sockets.
  for (const int signal : {SIGTERM, SIGKILL}) {
    if (isAlive()) ::kill(pid, signal);
    const auto deadline = std::chrono::steady_clock::now() + within;
    while (isAlive() && std::chrono::steady_clock::now() < deadline) {
      std::this_thread::sleep_for(kLookEvery);
    }
    if (!isAlive()) return;
  }
}

}  // namespace halvox::platform::linux_
