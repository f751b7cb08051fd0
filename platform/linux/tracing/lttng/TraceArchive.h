#pragma once

#include <filesystem>

#include "platform/linux/base/Result.h"

namespace halvox::platform::linux_ {

// Packs the regular files of a directory into a tar archive (pax, compressed with zstd).
//
// The archive appears under its name, with mode 0600, when it is complete and on the disk. Until
// then it is an unfinished file next to the packed directory. The directory must be in the file
// system of the archive. A service that is killed leaves the unfinished file there, and the next
// start deletes it.
//
// Blocks on the disk. Needs 64 KiB of memory and what the compression needs. After a failure
// nothing is left of the archive.
Result<void> packDirectory(const std::filesystem::path& directory,
                           const std::filesystem::path& archive);

}  // namespace halvox::platform::linux_
