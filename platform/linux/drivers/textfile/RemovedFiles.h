#pragma once

#include <filesystem>
#include <string>
#include <utility>
#include <vector>

#include "platform/linux/base/UniqueHandle.h"
#include "platform/object_log.h"

namespace halvox::platform::linux_ {

// Finds out which files were deleted from a directory since the last call, even if files with the
// same names exist again. Renaming a file over another one updates that one and does not delete it.
//
// It uses inotify, but no thread waits for it. The kernel keeps the names until the next call. An
// idle service therefore does not wake up. Belongs to one thread; the source owns it.
//
// Without the directory it reports nothing, and watches the directory once it exists. Without
// inotify it reports nothing either, which is logged once.
class RemovedFiles {
 public:
  struct Removed {
    bool areAll =
        false;  // the directory was replaced, or more files were deleted than the kernel keeps
    std::vector<std::string> names{};
  };

  // `log` must outlive this.
  RemovedFiles(std::filesystem::path directory, LogCategory& log)
      : directory_(std::move(directory)), log_(log, "RemovedFiles") {}

  // Returns the files that were deleted since the last call; none the first time. Does not block.
  [[nodiscard]] Removed take();

 private:
  void watch();

  const std::filesystem::path directory_;
  const ObjectLog log_;
  UniqueFd inotify_;
  int watched_ = -1;  // the watch on the directory; -1 if there is none
  bool isFailureLogged_ = false;
};

}  // namespace halvox::platform::linux_
