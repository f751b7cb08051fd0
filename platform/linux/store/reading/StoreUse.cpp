#include "platform/linux/store/reading/StoreUse.h"

#include <algorithm>
#include <charconv>
#include <fstream>
#include <iterator>
#include <string>

#include <sys/stat.h>
#include <unistd.h>

#include "platform/linux/base/ProcessStat.h"

namespace halvox::platform::linux_ {
namespace {

constexpr const char* kLockFileName = "halvox.lock";

// Returns the text up to the next blank and removes it with the blanks after it.
std::string_view takeWord(std::string_view& text) {
  const std::size_t end = std::min(text.find(' '), text.size());
  const std::string_view word = text.substr(0, end);
  text.remove_prefix(std::min(text.find_first_not_of(' ', end), text.size()));
  return word;
}

std::optional<double> startOf(pid_t process) {
  const auto stat = process > 0 ? readProcessStat(process) : std::nullopt;
  const auto ticksPerSecond = static_cast<double>(::sysconf(_SC_CLK_TCK));
  if (!stat || ticksPerSecond <= 0) return std::nullopt;
  return static_cast<double>(stat->startTicks) / ticksPerSecond;
}

}  // namespace

// A line: "2: FLOCK  ADVISORY  WRITE 4711 fe:00:131402 0 EOF". The fourth of these is a process,
// the next is a device and an inode. The device is not compared: on file systems that have several,
// it is another one than stat(2) returns.
std::optional<pid_t> lockHolder(std::string_view locks, std::uint64_t inode) {
  while (!locks.empty()) {
    const std::size_t end = std::min(locks.find('\n'), locks.size());
    std::string_view line = locks.substr(0, end);
    locks.remove_prefix(std::min(end + 1, locks.size()));
    takeWord(line);
    if (takeWord(line) != "FLOCK") continue;
    takeWord(line);
    takeWord(line);
    const std::string_view holder = takeWord(line);
    std::string_view place = takeWord(line);
    place.remove_prefix(std::min(place.rfind(':') + 1, place.size()));
    std::uint64_t locked = 0;
    const auto read = std::from_chars(place.data(), place.data() + place.size(), locked);
    if (read.ec != std::errc() || locked != inode) continue;
    pid_t process = 0;
    std::from_chars(holder.data(), holder.data() + holder.size(), process);
    return process;
  }
  return std::nullopt;
}

StoreServer storeServer(const std::filesystem::path& directory) {
  struct stat status {};
  if (::stat((directory / kLockFileName).c_str(), &status) != 0) return {};
  std::ifstream file("/proc/locks");
  if (!file) return {};
  const std::string locks{std::istreambuf_iterator<char>(file), {}};
  const std::optional<pid_t> holder = lockHolder(locks, status.st_ino);
  if (!holder) return {.use = StoreUse::kNotServed};
  return {.use = StoreUse::kServed,
          .start = startOf(*holder),
          .process = *holder > 0 ? holder : std::nullopt};
}

}  // namespace halvox::platform::linux_
