#pragma once

#include <cstdint>

#include "platform/linux/store/Sqlite.h"
#include "platform/linux/store/reading/verify/Differences.h"

namespace halvox::platform::linux_ {

// Compares the tables, views and indices of a database with those of an empty one of the same
// version. Sets `hasTables` to whether the database has all tables of that version, without which
// other verifications are impossible. Works in the open transaction of the connection. Returns
// SQLITE_OK or an error.
[[nodiscard]] SqliteCode verifySchema(Database& database, std::int64_t version,
                                      Differences& differences, bool& hasTables);

}  // namespace halvox::platform::linux_
