#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "platform/linux/store/Sqlite.h"
#include "platform/linux/store/StoreSchema.h"

namespace halvox::platform::linux_ {

// The tables of one kind of record. They must agree with the migrations in StoreSchema.cpp.
struct KindTables {
  std::string_view records;
  std::string_view spans;
  std::int64_t recordsPerSpan = kRecordsPerSpan;
  std::string_view newest = "id";       // the number of the newest record, in terms of its row
  std::string_view count = "count(*)";  // the number of records, over all rows
};

// Only versions without message_blocks wrote to analytics_records and link_message_records.
inline constexpr std::array<KindTables, 7> kKindTables{{
    {"analytics_records", "analytics_spans"},
    {"issue_metric_records", "issue_metric_spans"},
    {"power_event_records", "power_event_spans"},
    {"link_message_records", "link_message_spans"},
    {"snapshot_records", "snapshot_spans"},
    {"loss_records", "loss_spans"},
    {"message_blocks", "message_spans", 1, "id + records - 1", "ifnull(sum(records), 0)"},
}};

// The number of the newest record of each kind, in the order of kKindTables; 0 if there is none.
// The store reads these numbers when it opens its database. Because record numbers only grow, they
// separate the records of earlier runs from those of this run. A plain value.
struct StoreExtent {
  std::array<std::int64_t, kKindTables.size()> newest{};

  // Reads the extent, which needs only the last page of each table. Returns SQLITE_OK or an error.
  [[nodiscard]] static SqliteCode read(Database& database, StoreExtent& extent);
};

// Copies the records that are newer than `extent` from the database in `file` into `database`,
// which must be open for writing, have all tables and hold no records. Skips a kind that cannot be
// read. Returns the number of copied records. `problem` names what could not be copied, and is
// empty if everything was copied. Blocks on the disk.
[[nodiscard]] std::uint64_t copyRecordsAfter(const StoreExtent& extent, const std::string& file,
                                             Database& database, std::string& problem);

}  // namespace halvox::platform::linux_
