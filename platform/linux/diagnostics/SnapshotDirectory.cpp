#include "platform/linux/diagnostics/SnapshotDirectory.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <charconv>
#include <cmath>
#include <cstdint>
#include <cstdio>
#include <ctime>
#include <system_error>
#include <tuple>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/diagnostics/BoundedFile.h"

namespace halvox::platform::linux_ {
namespace {

namespace fs = std::filesystem;

constexpr const char* kTemporaryName = ".snapshot-in-work.tmp";
constexpr std::string_view kSuffix = ".tar.zst";
constexpr std::string_view kStampShape =
    "dddddddd"
    "T"
    "dddddd"
    "Z-";
constexpr std::size_t kLongestPart = 64;
constexpr int kMostOfOneSecond = 1000;
constexpr int kLargestNumber = 1'000'000;

std::string stampOf(Date time) {
  const auto seconds = static_cast<std::time_t>(std::floor(time.secondsSince1970));
  std::tm fields{};
  std::array<char, 32> text{};
  if (::gmtime_r(&seconds, &fields) == nullptr ||
      std::strftime(text.data(), text.size(), "%Y%m%dT%H%M%SZ", &fields) == 0) {
    return "00000000T000000Z";  // the clock's date has no calendar form
  }
  return text.data();
}

bool isSnapshotName(std::string_view name) {
  if (name.size() < kStampShape.size() + kSuffix.size() || !name.ends_with(kSuffix)) return false;
  for (std::size_t at = 0; at < kStampShape.size(); ++at) {
    const bool isDigit = name[at] >= '0' && name[at] <= '9';
    if (kStampShape[at] == 'd' ? !isDigit : name[at] != kStampShape[at]) return false;
  }
  return true;
}

// Renames a file without replacing another. Returns 0 or an errno.
int renameToFree(const fs::path& from, const fs::path& to) {
  if (::renameat2(AT_FDCWD, from.c_str(), AT_FDCWD, to.c_str(), RENAME_NOREPLACE) == 0) return 0;
  if (errno != EINVAL && errno != ENOSYS) return errno;
  // The file system does not support this flag. Testing whether the name exists is safe, because no
  // other program writes here.
  if (::access(to.c_str(), F_OK) == 0) return EEXIST;
  return ::rename(from.c_str(), to.c_str()) == 0 ? 0 : errno;
}

void syncDirectory(const fs::path& directory) {
  const UniqueFd descriptor(::open(directory.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (descriptor) ::fsync(descriptor.get());
}

// Returns n for a name "stamp-n-rest", and 1 for "stamp-rest".
int numberOf(std::string_view name) {
  const std::string_view rest = name.substr(kStampShape.size());
  int number = 1;
  const auto [end, error] = std::from_chars(rest.data(), rest.data() + rest.size(), number);
  const bool isNumbered = error == std::errc() && end != rest.data() + rest.size() && *end == '-';
  return isNumbered ? number : 1;
}

struct Named {
  std::string stamp;
  std::int64_t modified = 0;  // nanoseconds; orders snapshots of the same second
  fs::path path;
};

}  // namespace

std::string namePart(std::string_view text) {
  std::string part(text.substr(0, kLongestPart));
  for (char& character : part) {
    const bool stays = (character >= 'a' && character <= 'z') ||
                       (character >= 'A' && character <= 'Z') ||
                       (character >= '0' && character <= '9') || character == '_' ||
                       character == '-' || character == '.';
    // Types and sub-types come from messages and may contain anything, such as "/".
    if (!stays) character = '_';
  }
  if (part.empty()) return "unknown";
  if (part.front() == '.') part.front() = '_';
  return part;
}

fs::path SnapshotDirectory::temporaryPath() const { return path_ / kTemporaryName; }

Result<void> SnapshotDirectory::prepare() const {
  if (::mkdir(path_.c_str(), 0700) == 0 || errno == EEXIST) return {};
  return Failure<>{path_.native() + ": " + errnoText(errno)};
}

Result<fs::path> SnapshotDirectory::publish(Date time, std::string_view type,
                                            std::string_view subType) const {
  const std::string stamp = stampOf(time);
  const std::string rest = "-" + namePart(type) + "-" + namePart(subType) + std::string(kSuffix);
  // Number snapshots of the same second upwards. The name of a deleted snapshot must not be used
  // again, because the store's records may still refer to it.
  int first = 1;
  for (const fs::path& path : newestFirst()) {
    const std::string name = path.filename().string();
    if (name.starts_with(stamp))
      first = std::max(first, std::min(numberOf(name), kLargestNumber) + 1);
  }
  int error = EEXIST;
  for (int number = first; error == EEXIST && number < first + kMostOfOneSecond; ++number) {
    std::string name = stamp;
    if (number > 1) name.append("-").append(std::to_string(number));
    name += rest;
    const fs::path to = path_ / name;
    error = renameToFree(temporaryPath(), to);
    if (error != 0) continue;
    // Sync the directory, because the new name is not on the disk until then.
    syncDirectory(path_);
    return to;
  }
  return Failure<>{path_.native() + ": " + errnoText(error)};
}

std::vector<fs::path> SnapshotDirectory::newestFirst() const {
  std::vector<Named> all;
  std::error_code error;
  fs::directory_iterator at(path_, error);
  for (; !error && at != fs::directory_iterator(); at.increment(error)) {
    const std::string name = at->path().filename().string();
    struct stat status {};
    // All other files in the directory belong to others and are never deleted.
    if (!isSnapshotName(name) || ::lstat(at->path().c_str(), &status) != 0 ||
        !S_ISREG(status.st_mode)) {
      continue;
    }
    constexpr std::int64_t kNanoseconds = 1'000'000'000;
    all.push_back({.stamp = name.substr(0, kStampShape.size()),
                   .modified = status.st_mtim.tv_sec * kNanoseconds + status.st_mtim.tv_nsec,
                   .path = at->path()});
  }
  // Sort by the time in the name. The time of the file changes when it is copied or restored.
  std::ranges::sort(all, [](const Named& left, const Named& right) {
    return std::tie(left.stamp, left.modified, left.path) >
           std::tie(right.stamp, right.modified, right.path);
  });
  std::vector<fs::path> paths;
  paths.reserve(all.size());
  for (Named& one : all) paths.push_back(std::move(one.path));
  return paths;
}

void SnapshotDirectory::keepNewest(std::size_t count, const fs::path& justWritten) const {
  std::size_t kept = 1;  // the one just written
  for (const fs::path& path : newestFirst()) {
    // Keep this snapshot even if others look newer, because the clock may have been set back.
    if (path == justWritten) continue;
    if (kept < count) {
      ++kept;
    } else {
      ::unlink(path.c_str());
    }
  }
}

void SnapshotDirectory::removeLeftovers() const { ::unlink(temporaryPath().c_str()); }

}  // namespace halvox::platform::linux_
