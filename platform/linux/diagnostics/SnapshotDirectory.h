#pragma once

#include <cstddef>
#include <filesystem>
#include <optional>
#include <string>
#include <string_view>
#include <variant>
#include <vector>

#include "platform/value.h"

namespace halvox::platform::linux_ {

// The directory of snapshots: their names, which of them are kept, and what a service that was
// killed left there. Nothing is remembered between calls, so the directory may be deleted and come
// back at any time. Everything waits for the disk.
class SnapshotDirectory {
 public:
  struct Failure {
    std::string why;
  };

  explicit SnapshotDirectory(const std::filesystem::path& storageDirectory)
      : path_(storageDirectory / "snapshots") {}

  [[nodiscard]] const std::filesystem::path& path() const { return path_; }
  // Where a snapshot is while it is in work; there is one at a time.
  [[nodiscard]] std::filesystem::path temporaryPath() const;
  // Makes the directory, not its parents. None when it is there.
  [[nodiscard]] std::optional<Failure> prepare() const;
  // Gives the file at temporaryPath() its name for good, which no file has had: "stem.tar.zst", or
  // with a number in it.
  [[nodiscard]] std::variant<std::filesystem::path, Failure> publish(
      Date time, std::string_view type, std::string_view subType) const;
  // Deletes all snapshots but the newest; never the one just written, though a clock that was set
  // back may have made it look old. Files of other names are left alone.
  void keepNewest(std::size_t count, const std::filesystem::path& justWritten) const;
  // Deletes what was in work when a service ended.
  void removeLeftovers() const;
  // The snapshots, newest first.
  [[nodiscard]] std::vector<std::filesystem::path> newestFirst() const;

 private:
  std::filesystem::path path_;
};

// A text as a part of a file's name: letters, digits, '_', '-' and '.' stay, all else becomes '_';
// never empty, hidden or very long.
[[nodiscard]] std::string namePart(std::string_view text);

}  // namespace halvox::platform::linux_
