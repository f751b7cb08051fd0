#pragma once

#include <cstdint>
#include <string_view>

#include "platform/linux/store/Sqlite.h"

namespace halvox::platform::linux_ {

constexpr std::string_view kStoreFileName = "halvox.db";

// Records whose times one row of a table of spans sums up: span = record number / this.
constexpr std::int64_t kRecordsPerSpan = 512;

// The version that this program writes, kept in `PRAGMA user_version`.
extern const std::int64_t kStoreSchemaVersion;

// Brings a database of an older version, or an empty one, to the current version: each step in a
// transaction of its own. SQLITE_OK or an error; what was done before it is kept.
[[nodiscard]] SqliteCode migrate(Database& database);

}  // namespace halvox::platform::linux_
