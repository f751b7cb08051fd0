#include "platform/linux/diagnostics/FileTree.h"

#include <algorithm>
#include <system_error>

namespace halvox::platform::linux_ {
namespace {

namespace fs = std::filesystem;

// Finds and sorts the paths before any file is read. Otherwise the order of the directory, which
// is arbitrary, would decide which files are beyond the bounds.
std::vector<fs::path> filesBelow(const fs::path& root, const TreeBounds& bounds,
                                 const CaptureDeadline& deadline, Tree& tree) {
  // Directories and other entries count too, because a large tree with hardly any files must not be
  // walked to its end.
  constexpr std::size_t kLooksPerFile = 16;
  std::vector<fs::path> paths;
  std::size_t looks = 0;
  std::error_code error;
  fs::recursive_directory_iterator at(root, fs::directory_options::skip_permission_denied, error);
  if (error) {
    tree.failure = error.message();
    return paths;
  }
  for (; at != fs::recursive_directory_iterator(); at.increment(error)) {
    if (error) break;
    if (++looks > bounds.files * kLooksPerFile || deadline.hasPassed()) {
      tree.isCut = true;
      break;
    }
    std::error_code ignored;
    if (at.depth() + 1 >= bounds.depth) at.disable_recursion_pending();
    // Do not follow links, because they could lead out of the tree or in circles.
    if (at->is_symlink(ignored) || !at->is_regular_file(ignored)) continue;
    paths.push_back(at->path());
  }
  std::ranges::sort(paths);
  return paths;
}

}  // namespace

Tree readTree(const fs::path& root, const TreeBounds& bounds, const CaptureDeadline& deadline) {
  Tree tree;
  std::size_t room = bounds.bytes;
  for (const fs::path& path : filesBelow(root, bounds, deadline, tree)) {
    if (tree.files.size() == bounds.files || room == 0 || deadline.hasPassed()) {
      tree.isCut = true;
      break;
    }
    Finding finding = readBounded(path, std::min(bounds.bytesOfFile, room));
    // Count a file that cannot be read, and continue with the others.
    if (!finding.isCollected()) {
      ++tree.unreadable;
      continue;
    }
    tree.isCut = tree.isCut || finding.isCut;
    room -= finding.bytes.size();
    tree.files.push_back({path.lexically_relative(root), std::move(finding.bytes)});
  }
  return tree;
}

}  // namespace halvox::platform::linux_
