#pragma once

#include <filesystem>

#include "platform/linux/store/reading/verify/Differences.h"

namespace halvox::platform::linux_ {

// Verifies the write-ahead log of a database: the checksums of its frames, and that it has all
// frames that its index says were committed. SQLite itself ignores the log from the first wrong
// frame on and says nothing: the commits after it are gone.
//
// The index (the file with the suffix -shm) survives a killed process. Whatever opens the database
// next makes a new index from the log. Call this function first. A log without an index, as in a
// copy, cannot be known to be complete; a wrong frame with right ones after it is still found.
//
// Reads the files only, without a lock. A service may write to them meanwhile. Blocks on the disk.
void verifyLog(const std::filesystem::path& database, Differences& differences);

}  // namespace halvox::platform::linux_
