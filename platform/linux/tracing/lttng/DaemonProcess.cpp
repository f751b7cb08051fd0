#include "platform/linux/tracing/lttng/DaemonProcess.h"

#include <csignal>
#include <fstream>
#include <string>
#include <thread>

#include "platform/linux/base/ProcessStat.h"

namespace halvox::platform::linux_ {
namespace {

// The polling interval. The process is not a child of this one, which can therefore not wait for
// it.
constexpr std::chrono::milliseconds kLookEvery{10};

// Empty if there is no such process, or if it has ended and its parent has not waited for it.
std::string startTimeOf(pid_t pid) {
  const auto stat = readProcessStat(pid);
  if (!stat.has_value() || stat->state == 'Z') return {};
  return std::to_string(stat->startTicks);
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
  // Close the file before the check, because the bytes may reach it only then.
  file.close();
  return !file.fail();
}

bool DaemonProcess::isAlive() const { return !startTime.empty() && startTimeOf(pid) == startTime; }

void DaemonProcess::end(std::chrono::milliseconds within) const {
  // Send SIGTERM first, so that the daemon can end its consumer and remove its sockets.
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
