#include "platform/linux/settings/LinkedFiles.h"

#include <cstddef>
#include <deque>
#include <system_error>

namespace halvox::platform::linux_ {
namespace {

namespace fs = std::filesystem;

// The kernel follows at most this many links (path_resolution(7)).
constexpr std::size_t kMostLinks = 40;

}  // namespace

std::vector<fs::path> linkedFiles(const fs::path& path) {
  std::vector<fs::path> found;
  std::deque<fs::path> rest(path.begin(), path.end());
  fs::path way;
  while (!rest.empty() && found.size() < kMostLinks) {
    const fs::path part = rest.front();
    rest.pop_front();
    if (part.empty() || part == ".") continue;
    // Resolve ".." from the target of the links before it, as the kernel does. lexically_normal()
    // would be wrong after a link.
    if (part == "..") {
      way = way.parent_path();
      continue;
    }
    const fs::path next = way / part;  // "/" as part, from an absolute link, starts at the root
    std::error_code isNoLink;
    const fs::path target = fs::read_symlink(next, isNoLink);
    if (isNoLink) {
      way = next;
    } else {
      found.push_back(next);
      rest.insert(rest.begin(), target.begin(), target.end());
    }
  }
  // Add the target, too, because a change of the target is a change of the file.
  if (!found.empty()) found.push_back(way);
  return found;
}

}  // namespace halvox::platform::linux_
