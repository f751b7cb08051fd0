#pragma once

#include <cstdint>
#include <string_view>

#include "platform/linux/store/Sqlite.h"
#include "platform/linux/store/reading/verify/Differences.h"

namespace halvox::platform::linux_ {

// A kind of record of which each has a row. Pass constants, because the names are not copied.
struct VerifiedRows {
  std::string_view records;  // the table
  std::string_view spans;    // the table of their spans
  std::string_view payload;  // the column that has a JSON object; empty if none has
};

// Verifies a kind whose records have a row each: that a span covers the number and the time of each
// record, and that payloads are JSON. Adds the number of records to `count`. Works in the open
// transaction of the connection. Returns SQLITE_OK, also after damage, which becomes a difference;
// any other error as it is. Blocks on the disk.
[[nodiscard]] SqliteCode verifyRows(Database& database, const VerifiedRows& rows,
                                    Differences& differences, std::uint64_t& count);

// Verifies that the names of old events are in `event_names`, in the same way.
[[nodiscard]] SqliteCode verifyEventNames(Database& database, Differences& differences);

}  // namespace halvox::platform::linux_
