#pragma once

#include <cstdint>
#include <filesystem>
#include <map>
#include <string>
#include <vector>

#include "platform/linux/base/Result.h"

namespace halvox::tools {

// Returns the contents of the files in `names`, by name. A file that the snapshot lacks is absent
// from the result. The message of a failure names the file and the reason. Blocks on the disk.
//
// A snapshot may come from an untrusted source. It is an error if it is larger than any that the
// service writes, or if it holds anything but plain files and directories.
[[nodiscard]] platform::linux_::Result<std::map<std::string, std::string>> readSnapshotFiles(
    const std::filesystem::path& snapshot, const std::vector<std::string>& names);

// What happens to files in the directory that have the name of one in the snapshot.
enum class ExistingFiles : std::uint8_t { kRefuse, kReplace };

// Unpacks a snapshot below `directory`, creates that directory if needed, and returns the names of
// the entries. Blocks on the disk.
//
// It is an error if the snapshot holds anything but plain files and directories, a name leads out
// of the directory, a symbolic link is in the way, or a file exists and `existing` is kRefuse.
// Errors that the archive itself shows are found before anything is unpacked, and no directory is
// left behind. After an error while writing, such as a full disk, the files that were written
// before remain.
//
// Changes the working directory of the process while it runs: no other thread may use relative
// paths.
[[nodiscard]] platform::linux_::Result<std::vector<std::string>> unpackSnapshot(
    const std::filesystem::path& snapshot, const std::filesystem::path& directory,
    ExistingFiles existing);

}  // namespace halvox::tools
