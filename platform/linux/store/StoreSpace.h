#pragma once

#include <cstdint>
#include <filesystem>

#include "platform/linux/store/Sqlite.h"

namespace halvox::platform::linux_ {

// What a vacuum and an erasure both do with the space of a database. Writer's thread only.

// Return the size of the write-ahead log, and of the database and the log together, in bytes.
[[nodiscard]] std::uint64_t logBytes(const std::filesystem::path& database);
[[nodiscard]] std::uint64_t bytesWithLog(const std::filesystem::path& database);

// Gives some free pages back. Sets `more` to whether any remain.
[[nodiscard]] SqliteCode giveBackPages(Database& database, bool& more);

// Copies the write-ahead log into the database, which becomes shorter only then, and empties the
// log. Sets `isHeld` if a reader needs an older state of the database; then the log stays. SQLite
// empties it after a later transaction.
[[nodiscard]] SqliteCode emptyLog(Database& database, bool& isHeld);

}  // namespace halvox::platform::linux_
