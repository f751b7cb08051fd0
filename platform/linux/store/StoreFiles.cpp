#include "platform/linux/store/StoreFiles.h"

#include <array>
#include <cerrno>
#include <ctime>
#include <system_error>

#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/store/StoreSchema.h"

namespace halvox::platform::linux_ {
namespace {

constexpr std::string_view kLockFileName = "halvox.lock";
// The database, its write-ahead log and the index of the log. They are renamed together, because
// SQLite would copy a log that stays into the new database of the same name.
constexpr std::array<std::string_view, 3> kSuffixes{"", "-wal", "-shm"};
constexpr mode_t kFileMode = 0640;
// The time in the name of a damaged database has a resolution of one second. If the name exists, a
// number is added to it. This bound ends the search for a free number in a directory full of such
// files; the rename then replaces the file with the last number.
constexpr int kMostNamesTried = 100;

Failure<StoreError> failure(StoreError code, const std::filesystem::path& path,
                            std::string_view what, int error) {
  return {code, path.native() + ": " + std::string(what) + ": " + errnoText(error)};
}

std::filesystem::path withSuffix(const std::filesystem::path& path, std::string_view suffix) {
  return path.native() + std::string(suffix);
}

std::uint64_t sizeOf(const std::filesystem::path& path) {
  struct stat status {};
  return ::stat(path.c_str(), &status) == 0 ? static_cast<std::uint64_t>(status.st_size) : 0;
}

std::string utcStamp() {
  const std::time_t now = std::time(nullptr);
  std::tm parts{};
  ::gmtime_r(&now, &parts);
  std::array<char, 32> buffer;
  const std::size_t length = std::strftime(buffer.data(), buffer.size(), "%Y%m%dT%H%M%SZ", &parts);
  return {buffer.data(), length};
}

bool anyExists(const std::filesystem::path& base) {
  for (const std::string_view suffix : kSuffixes) {
    if (::access(withSuffix(base, suffix).c_str(), F_OK) == 0) return true;
  }
  return false;
}

// Creates an empty file; fails with EEXIST if there is one. A file that root creates gets the owner
// of the directory: halvoxctl, run by root, may be the first to need the file, and the service, run
// by a user of its own, must be able to open it later.
UniqueFd createOwned(const std::filesystem::path& directory, const std::filesystem::path& file) {
  UniqueFd made(::open(file.c_str(), O_RDWR | O_CREAT | O_EXCL | O_CLOEXEC, kFileMode));
  struct stat owner {};
  if (!made || ::geteuid() != 0 || ::stat(directory.c_str(), &owner) != 0 || owner.st_uid == 0) {
    return made;
  }
  // If this fails, the file is usable for this process, and the service reports what it cannot
  // open.
  static_cast<void>(::fchown(made.get(), owner.st_uid, owner.st_gid));
  return made;
}

}  // namespace

std::optional<FileIdentity> fileIdentity(const std::filesystem::path& path) {
  struct stat status {};
  if (::stat(path.c_str(), &status) != 0) return std::nullopt;
  return FileIdentity{status.st_dev, status.st_ino};
}

StoreFiles::StoreFiles(const std::filesystem::path& directory)
    : directory_(directory), database_(directory / kStoreFileName) {}

Result<void, StoreError> StoreFiles::claimDirectory() {
  struct stat status {};
  // Take the lock again if its file was removed, because another service would create and lock a
  // new file.
  if (lock_ && ::fstat(lock_.get(), &status) == 0 && status.st_nlink > 0) return {};
  std::error_code error;
  std::filesystem::create_directories(directory_, error);
  if (error) {
    return failure(StoreError::kDirectory, directory_, "cannot create the storage directory",
                   error.value());
  }
  const std::filesystem::path path = directory_ / kLockFileName;
  lock_ = createOwned(directory_, path);
  if (!lock_ && errno == EEXIST) lock_.reset(::open(path.c_str(), O_RDWR | O_CLOEXEC));
  if (!lock_) {
    return failure(StoreError::kDirectory, path, "cannot open the lock file", errno);
  }
  if (::flock(lock_.get(), LOCK_EX | LOCK_NB) == 0) return {};
  const int reason = errno;
  lock_.reset();
  if (reason != EWOULDBLOCK) {
    return failure(StoreError::kCannotOpen, path, "cannot lock the file", reason);
  }
  return Failure<StoreError>{StoreError::kInUse,
                             database_.native() +
                                 ": another service is using this store; stop it or set "
                                 "another storage.directory"};
}

Result<void, StoreError> StoreFiles::makeDatabaseFile() {
  // Rename the log of a database that was removed. SQLite must not apply it to the new database.
  if (sizeOf(database_) == 0 && logBytes() > 0) {
    if (auto log = setAside(); !log) return std::move(log).error();
  }
  // Create the file here, because SQLite would make it readable for all users. SQLite gives the log
  // the same mode as the database.
  const UniqueFd made = createOwned(directory_, database_);
  if (made || errno == EEXIST) return {};
  return failure(StoreError::kDirectory, database_, "cannot create the database file", errno);
}

Result<std::string, StoreError> StoreFiles::setAside() {
  const std::string wanted = database_.native() + ".damaged-" + utcStamp();
  std::string newName = wanted;
  for (int number = 2; anyExists(newName) && number < kMostNamesTried; ++number) {
    newName = wanted + "-" + std::to_string(number);
  }
  for (const std::string_view suffix : kSuffixes) {
    const auto from = withSuffix(database_, suffix);
    if (::rename(from.c_str(), withSuffix(newName, suffix).c_str()) == 0 || errno == ENOENT) {
      continue;
    }
    return failure(StoreError::kDirectory, from, "cannot rename the damaged file", errno);
  }
  return newName;
}

std::optional<FileIdentity> StoreFiles::identity() const { return fileIdentity(database_); }

std::uint64_t StoreFiles::logBytes() const { return sizeOf(withSuffix(database_, "-wal")); }

}  // namespace halvox::platform::linux_
