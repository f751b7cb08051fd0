#pragma once

#include <filesystem>
#include <vector>

namespace halvox::platform::linux_ {

// Returns the files that an absolute path depends on when it contains symbolic links: each link, in
// the order in which the kernel follows them, and last the file that they lead to, which need not
// exist. The directories of the returned paths contain no links. Returns an empty list for a path
// without links. Stops after 40 links, as the kernel does. Blocks on the disk.
std::vector<std::filesystem::path> linkedFiles(const std::filesystem::path& path);

}  // namespace halvox::platform::linux_
