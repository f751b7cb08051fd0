#pragma once

#include <cstdint>
#include <string_view>

#include "platform/linux/store/Sqlite.h"

namespace halvox::platform::linux_ {

constexpr std::string_view kStoreFileName = "halvox.db";

// How many records one row of a table of spans covers. Record `id` is in span `id /
// kRecordsPerSpan`. Stored rows depend on this number, and changing it needs a migration.
constexpr std::int64_t kRecordsPerSpan = 512;

// The schema version that this program writes, stored in `PRAGMA user_version`.
extern const std::int64_t kStoreSchemaVersion;

// The first schema version with message_blocks.
constexpr std::int64_t kBlocksSinceVersion = 3;

// Migrates an empty or older database to the current version, with one transaction for each step.
// After an error, rolls the failed step back, keeps the steps before it and returns the code. The
// next call continues with the failed step. The database must not be newer than
// kStoreSchemaVersion.
[[nodiscard]] SqliteCode migrate(Database& database);
// The same up to `version`, for comparing a database with an empty one of its version.
[[nodiscard]] SqliteCode migrateTo(Database& database, std::int64_t version);

}  // namespace halvox::platform::linux_
