#pragma once

#include <filesystem>
#include <string>
#include <utility>
#include <vector>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {

// Notices which files were deleted from a directory since it was last asked, also when files of the
// same names are there again. A file that another one is renamed over was not deleted: so are files
// updated. Nothing wakes up for it: the kernel keeps the names until somebody asks.
// Belongs to one thread. Without the directory, or without inotify, it notices nothing; the latter
// is logged once. A directory that is made later is watched from the next time on.
class RemovedFiles {
 public:
  struct Removed {
    bool areAll = false;  // the directory itself was replaced, or too many to remember
    std::vector<std::string> names{};
  };

  explicit RemovedFiles(std::filesystem::path directory) : directory_(std::move(directory)) {}

  // Those since the last call; none the first time. Does not block.
  [[nodiscard]] Removed take();

 private:
  void watch();

  const std::filesystem::path directory_;
  UniqueFd inotify_;
  int watched_ = -1;  // the watch of the directory; -1: none
  bool isFailureLogged_ = false;
};

}  // namespace halvox::platform::linux_
