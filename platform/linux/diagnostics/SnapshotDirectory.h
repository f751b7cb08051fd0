#pragma once

#include <cstddef>
#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/base/Result.h"
#include "platform/value.h"

namespace halvox::platform::linux_ {

// The directory that holds the snapshots: names them, deletes old ones, and removes the unfinished
// file of a service that was killed. Remembers nothing between calls, because the directory may be
// deleted at any time. Any thread may use it. All functions except path() and temporaryPath() block
// on the disk.
class SnapshotDirectory {
 public:
  explicit SnapshotDirectory(const std::filesystem::path& storageDirectory)
      : path_(storageDirectory / "snapshots") {}

  [[nodiscard]] const std::filesystem::path& path() const { return path_; }
  // The path of a snapshot while it is being written. There is only one at a time.
  [[nodiscard]] std::filesystem::path temporaryPath() const;
  // Creates the directory unless it exists, but not its parents.
  [[nodiscard]] Result<void> prepare() const;
  // Renames the file at temporaryPath() to its final name and returns the new path. The name is
  // "<UTC time>-<type>-<sub-type>.tar.zst", with a number after the time if there already are
  // snapshots of the same time. Never replaces a file.
  [[nodiscard]] Result<std::filesystem::path> publish(Date time, std::string_view type,
                                                      std::string_view subType) const;
  // Deletes all snapshots except the newest `count`. Never deletes `justWritten`, which looks old
  // after the clock was set back. Files with other names are not touched.
  void keepNewest(std::size_t count, const std::filesystem::path& justWritten) const;
  // Deletes the unfinished snapshot of a service that was killed.
  void removeLeftovers() const;
  // Returns the paths of the snapshots, newest first.
  [[nodiscard]] std::vector<std::filesystem::path> newestFirst() const;

 private:
  std::filesystem::path path_;
};

// Makes a text safe as part of a file name. Keeps letters, digits, '_', '-' and '.', and replaces
// every other byte by '_'. The result is not empty, has at most 64 bytes and does not begin with a
// dot.
[[nodiscard]] std::string namePart(std::string_view text);

}  // namespace halvox::platform::linux_
