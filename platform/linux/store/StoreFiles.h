#pragma once

#include <filesystem>
#include <optional>
#include <string>
#include <string_view>

#include <sys/types.h>

#include "platform/linux/base/Result.h"
#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/store/StoreError.h"

namespace halvox::platform::linux_ {

// Identifies the file to which a path leads. Comparing two identities shows whether the path leads
// to another file now.
struct FileIdentity {
  dev_t device = 0;
  ino_t inode = 0;
  friend bool operator==(const FileIdentity&, const FileIdentity&) = default;
};

// The files of one store in its directory: the lock, the database and its write-ahead log.
// Owned by the store or by a reader. Only one thread at a time uses it; in the service, first the
// thread that opens the store, then the writer. Calls block on the disk.
class StoreFiles {
 public:
  explicit StoreFiles(const std::filesystem::path& directory);

  // Creates the directory and its parents, and takes the lock that prevents a second service from
  // using the store. Holds the lock until this object is destroyed. A second call is cheap and
  // takes the lock again if the lock file was removed. Fails with kDirectory, kInUse or
  // kCannotOpen.
  Result<void, StoreError> claimDirectory();
  // Creates an empty database file, readable by owner and group, unless one exists. First renames a
  // write-ahead log without a database, because SQLite would delete such a log when it opens the
  // empty file.
  Result<void, StoreError> makeDatabaseFile();
  // Renames the database, its log and its index to halvox.db.damaged-<UTC time> and returns the
  // new path. Nothing is deleted. The database must not be open in this process.
  Result<std::string, StoreError> setAside();

  [[nodiscard]] const std::filesystem::path& database() const { return database_; }
  // Returns the file to which the database's path leads now; std::nullopt if there is none.
  [[nodiscard]] std::optional<FileIdentity> identity() const;
  // Returns the size of the write-ahead log; 0 if there is none.
  [[nodiscard]] std::uint64_t logBytes() const;

 private:
  std::filesystem::path directory_;
  std::filesystem::path database_;
  UniqueFd lock_;
};

// Returns the file to which a path leads now; std::nullopt if there is none.
[[nodiscard]] std::optional<FileIdentity> fileIdentity(const std::filesystem::path& path);

}  // namespace halvox::platform::linux_
