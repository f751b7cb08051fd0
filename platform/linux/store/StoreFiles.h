#pragma once

#include <filesystem>
#include <optional>
#include <string>
#include <string_view>

#include <sys/types.h>

#include "platform/linux/UniqueHandle.h"
#include "platform/linux/store/StoreError.h"

namespace halvox::platform::linux_ {

// Which file a path led to, to notice later that it leads to another one or to none.
struct FileIdentity {
  dev_t device = 0;
  ino_t inode = 0;
  friend bool operator==(const FileIdentity&, const FileIdentity&) = default;
};

// The files of one store in its directory: the lock, the database and its write-ahead log.
// Belongs to the writer's thread, after the opening on the thread that starts it.
class StoreFiles {
 public:
  explicit StoreFiles(const std::filesystem::path& directory);

  // Makes the directory with its parents, and takes the lock that keeps a second service away. The
  // lock is held until this object goes; taking it again is cheap and notices a removed lock file.
  [[nodiscard]] std::optional<StoreError> claimDirectory();
  // Makes an empty database file, readable by owner and group, if there is none. A write-ahead log
  // without its database is set aside first, because a new database must not meet an old log.
  [[nodiscard]] std::optional<StoreError> makeDatabaseFile();
  // Renames the database and what belongs to it to halvox.db.damaged-<UTC time>, and gives the new
  // name. Nobody may have the database open.
  [[nodiscard]] std::optional<StoreError> setAside(std::string& newName);

  [[nodiscard]] const std::filesystem::path& database() const { return database_; }
  // The file that the database's path leads to now.
  [[nodiscard]] std::optional<FileIdentity> identity() const;
  [[nodiscard]] std::uint64_t logBytes() const;

 private:
  std::filesystem::path directory_;
  std::filesystem::path database_;
  UniqueFd lock_;
};

// The file that a path leads to now; none when there is none.
[[nodiscard]] std::optional<FileIdentity> fileIdentity(const std::filesystem::path& path);

}  // namespace halvox::platform::linux_
