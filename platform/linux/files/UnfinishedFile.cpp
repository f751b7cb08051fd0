#include "platform/linux/files/UnfinishedFile.h"

#include <atomic>
#include <cerrno>
#include <chrono>
#include <utility>

#include <dirent.h>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

namespace halvox::platform::linux_ {
namespace {

using DirectoryStream = UniqueHandle<DIR*, ::closedir>;

constexpr mode_t kPermissions = 0644;
constexpr std::string_view kOwnNameStart = ".halvox-";
constexpr std::string_view kOwnNameEnd = ".tmp";
// Left-over files must be at least this old. Another process may have created a younger file and
// not locked it yet.
constexpr std::chrono::seconds kLeftOverAge{60};

std::string makeOwnName() {
  static std::atomic<unsigned> made{0};  // relaxed: the numbers only have to differ
  return std::string(kOwnNameStart) + std::to_string(::getpid()) + "-" +
         std::to_string(made.fetch_add(1, std::memory_order_relaxed)) + std::string(kOwnNameEnd);
}

bool isLeftOver(int directory, const char* name) {
  const std::string_view text(name);
  if (!text.starts_with(kOwnNameStart) || !text.ends_with(kOwnNameEnd)) return false;
  const UniqueFd file(
      ::openat(directory, name, O_RDONLY | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY | O_CLOEXEC));
  struct stat status {};
  if (!file || ::fstat(file.get(), &status) != 0 || !S_ISREG(status.st_mode)) return false;
  const auto age = ::time(nullptr) - status.st_mtime;
  // The writer holds a lock on a file that it still writes. If the writer was killed, the kernel
  // has released the lock.
  return age > kLeftOverAge.count() && ::flock(file.get(), LOCK_EX | LOCK_NB) == 0;
}

}  // namespace

int UnfinishedFile::begin(UniqueFd directory, Naming naming) {
  directory_ = std::move(directory);
  if (naming == Naming::kOwnName) return beginNamed();
  // Try to create a file without a name. The kernel removes such a file with its last descriptor,
  // even if the process is killed.
  file_.reset(::openat(directory_.get(), ".", O_TMPFILE | O_WRONLY | O_CLOEXEC, kPermissions));
  if (file_) return 0;
  const bool isUnknown = errno == EOPNOTSUPP || errno == EISDIR || errno == EINVAL;
  return isUnknown ? beginNamed() : errno;
}

int UnfinishedFile::beginNamed() {
  constexpr int kFlags = O_WRONLY | O_CREAT | O_EXCL | O_NOFOLLOW | O_CLOEXEC;
  do {
    ownName_ = makeOwnName();
    file_.reset(::openat(directory_.get(), ownName_.c_str(), kFlags, kPermissions));
  } while (!file_ && errno == EEXIST);
  if (!file_) {
    ownName_.clear();
    return errno;
  }
  // Until the file is locked, its age protects it, because other processes remove only older files.
  return ::flock(file_.get(), LOCK_EX | LOCK_NB) == 0 ? 0 : errno;
}

int UnfinishedFile::write(std::string_view bytes) {
  while (!bytes.empty()) {
    const ssize_t count = ::write(file_.get(), bytes.data(), bytes.size());
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return errno;
    bytes.remove_prefix(static_cast<std::size_t>(count));
  }
  return 0;
}

int UnfinishedFile::finish(const std::string& name) {
  // Sync the file before giving it its name. After a power cut, a file with this name must have its
  // content.
  if (::fsync(file_.get()) != 0) return errno;
  if (const int error = giveName(name)) return error;
  ownName_.clear();
  // Sync the directory, too, because it holds the name. A file system that cannot sync a directory
  // returns EINVAL; the file is finished nevertheless.
  if (::fsync(directory_.get()) != 0 && errno != EINVAL) return errno;
  // Remove left-over files now, because this changes the directory in any case.
  removeLeftOvers();
  discard();
  return 0;
}

int UnfinishedFile::giveName(const std::string& name) {
  // linkat() cannot replace a file, but renameat() can. If the name is taken, link the file under a
  // temporary name and rename it.
  if (ownName_.empty()) {
    const std::string link = "/proc/self/fd/" + std::to_string(file_.get());
    const auto giveTo = [&](const std::string& to) {
      const bool done =
          ::linkat(AT_FDCWD, link.c_str(), directory_.get(), to.c_str(), AT_SYMLINK_FOLLOW) == 0;
      return done ? 0 : errno;
    };
    if (const int error = giveTo(name); error != EEXIST) return error;
    std::string ownName = makeOwnName();
    if (const int error = giveTo(ownName)) return error;
    ownName_ = std::move(ownName);
  }
  const bool done =
      ::renameat(directory_.get(), ownName_.c_str(), directory_.get(), name.c_str()) == 0;
  return done ? 0 : errno;
}

// Deletes the temporary files of services that were killed while they wrote.
void UnfinishedFile::removeLeftOvers() const {
  UniqueFd again(::openat(directory_.get(), ".", O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  const DirectoryStream stream(again ? ::fdopendir(again.get()) : nullptr);
  if (!stream) return;
  static_cast<void>(again.release());
  while (const dirent* const entry = ::readdir(stream.get())) {
    if (isLeftOver(directory_.get(), entry->d_name)) {
      ::unlinkat(directory_.get(), entry->d_name, 0);
    }
  }
}

void UnfinishedFile::discard() {
  if (!ownName_.empty()) ::unlinkat(directory_.get(), ownName_.c_str(), 0);
  ownName_.clear();
  file_.reset();
  directory_.reset();
}

}  // namespace halvox::platform::linux_
