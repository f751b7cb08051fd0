#pragma once

#include <filesystem>
#include <vector>

namespace halvox::platform::linux_ {

// What an absolute path depends on beside its own directory: every symbolic link on the way to it,
// in the order in which they are followed, and then the file that they lead to, whether it is there
// or not. The directories of these paths have no links in them. Empty when there is no link on the
// way; links that never end are followed for a while.
std::vector<std::filesystem::path> linkedFiles(const std::filesystem::path& path);

}  // namespace halvox::platform::linux_
