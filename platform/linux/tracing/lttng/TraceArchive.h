#pragma once

#include <filesystem>
#include <optional>
#include <string>

namespace halvox::platform::linux_ {

// Packs the regular files of a directory into a tar archive (pax, compressed by zstd) of that path,
// which has its name, mode 0600, when it is whole and on the disk. Until then it is beside the
// directory, which must be in the same file system, and goes with it when the service is killed.
// Blocks for the disk; needs the memory of one piece of a file. The failure in words; nothing is
// then left of the archive.
[[nodiscard]] std::optional<std::string> packDirectory(const std::filesystem::path& directory,
                                                       const std::filesystem::path& archive);

}  // namespace halvox::platform::linux_
