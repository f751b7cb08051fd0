#pragma once

#include <cstddef>
#include <filesystem>
#include <string>
#include <vector>

#include "platform/linux/diagnostics/BoundedFile.h"
#include "platform/linux/diagnostics/WaitableFlag.h"

namespace halvox::platform::linux_ {

// How much of a directory tree is read.
struct TreeBounds {
  int depth = 6;
  std::size_t files = 512;
  std::size_t bytesOfFile = 64U << 10U;  // of one file
  std::size_t bytes = 1U << 20U;         // of all files together
};

struct TreeFile {
  std::filesystem::path path;  // relative to the root of the tree
  std::string bytes;
};

struct Tree {
  std::vector<TreeFile> files;  // sorted by path
  std::size_t unreadable = 0;   // the number of files that could not be read
  bool isCut = false;           // a bound or the deadline was reached
  std::string failure;          // why the root could not be read; empty if it was
};

// Reads the regular files below a directory. Does not follow links. Blocks on the disk; stops at
// the deadline.
[[nodiscard]] Tree readTree(const std::filesystem::path& root, const TreeBounds& bounds,
                            const CaptureDeadline& deadline);

}  // namespace halvox::platform::linux_
