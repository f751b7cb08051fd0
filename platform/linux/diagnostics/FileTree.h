#pragma once

#include <cstddef>
#include <filesystem>
#include <string>
#include <vector>

#include "platform/linux/diagnostics/BoundedFile.h"
#include "platform/linux/diagnostics/WaitableFlag.h"

namespace halvox::platform::linux_ {

// How much of a tree of files is copied.
struct TreeBounds {
  int depth = 6;
  std::size_t files = 512;
  std::size_t bytesOfFile = 64U << 10U;
  std::size_t bytes = 1U << 20U;
};

struct TreeFile {
  std::filesystem::path path;  // below the tree's root
  std::string bytes;
};

struct Tree {
  std::vector<TreeFile> files;  // in the order of their paths
  std::size_t unreadable = 0;   // files that could not be read
  bool isCut = false;           // there is more than the bounds allow
  std::string failure;          // why there is no tree at all
};

// The readable regular files below a directory. Links are not followed.
[[nodiscard]] Tree readTree(const std::filesystem::path& root, const TreeBounds& bounds,
                            const Deadline& deadline);

}  // namespace halvox::platform::linux_
