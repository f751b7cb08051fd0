#include "platform/linux/store/reading/StoreUse.h"

#include <algorithm>
#include <charconv>
#include <fstream>
#include <iterator>
#include <string>

#include <sys/stat.h>

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

}  // namespace

// A line: "2: FLOCK  ADVISORY  WRITE 4711 fe:00:131402 0 EOF". The fourth of these is a process,
// the next is a device and an inode. The device is not compared: on file systems that have several,
// it is another one than stat(2) returns.
bool isLocked(std::string_view locks, std::uint64_t inode) {
  while (!locks.empty()) {
    const std::size_t end = std::min(locks.find('\n'), locks.size());
    std::string_view line = locks.substr(0, end);
    locks.remove_prefix(std::min(end + 1, locks.size()));
    takeWord(line);
    if (takeWord(line) != "FLOCK") continue;
    takeWord(line);
    takeWord(line);
    takeWord(line);
    std::string_view place = takeWord(line);
    place.remove_prefix(std::min(place.rfind(':') + 1, place.size()));
    std::uint64_t locked = 0;
    const auto read = std::from_chars(place.data(), place.data() + place.size(), locked);
    if (read.ec == std::errc() && locked == inode) return true;
  }
  return false;
}

StoreUse storeUse(const std::filesystem::path& directory) {
  struct stat status {};
  if (::stat((directory / kLockFileName).c_str(), &status) != 0) return StoreUse::kUnknown;
  std::ifstream file("/proc/locks");
  if (!file) return StoreUse::kUnknown;
  const std::string locks{std::istreambuf_iterator<char>(file), {}};
  return isLocked(locks, status.st_ino) ? StoreUse::kServed : StoreUse::kNotServed;
}

}  // namespace halvox::platform::linux_
