#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string_view>

namespace halvox::platform::linux_ {

enum class ColumnType : std::uint8_t { kInteger, kText, kBytes };

struct RecordColumn {
  std::string_view name;
  ColumnType type;
};

// Describes one kind of record of which each has a row of its own. The writer, the readers and
// retention make their SQL from this description. Names and columns must agree with the migrations
// in StoreSchema.cpp.
struct RecordTable {
  std::string_view records;               // the table of the records
  std::string_view spans;                 // the table of their first and last times
  std::span<const RecordColumn> columns;  // after id and time, which all kinds have
  std::size_t nameColumn;                 // the column that name patterns match, or kNoColumn
  std::int64_t sinceVersion;              // the schema version that introduced the kind
  std::string_view piece;                 // the name under which its records are counted
};

constexpr std::size_t kNoColumn = static_cast<std::size_t>(-1);

// Indices into RecordTable::columns.
enum IssueMetricColumn : std::uint8_t { kMetricID, kMetricMessage };
enum PowerEventColumn : std::uint8_t { kPowerCategory, kPowerEventName, kPowerPayload };
enum LinkMessageColumn : std::uint8_t {
  kLinkSessionID,
  kLinkClientName,
  kLinkServiceName,
  kLinkCategory,
  kLinkType,
  kLinkPayload,
};
enum SnapshotColumn : std::uint8_t { kSnapshotSignature, kSnapshotPath };
enum LossColumn : std::uint8_t { kLossPiece, kLossReason, kLossCount };

inline constexpr std::array kIssueMetricColumns{
    RecordColumn{"metric_id", ColumnType::kInteger},
    RecordColumn{"message", ColumnType::kBytes},
};
inline constexpr std::array kPowerEventColumns{
    RecordColumn{"category_id", ColumnType::kInteger},
    RecordColumn{"event_name", ColumnType::kText},
    RecordColumn{"payload", ColumnType::kText},
};
inline constexpr std::array kLinkMessageColumns{
    RecordColumn{"session_id", ColumnType::kInteger},
    RecordColumn{"client_name", ColumnType::kText},
    RecordColumn{"service_name", ColumnType::kText},
    RecordColumn{"category", ColumnType::kInteger},
    RecordColumn{"type", ColumnType::kInteger},
    RecordColumn{"payload", ColumnType::kText},
};
inline constexpr std::array kSnapshotColumns{
    RecordColumn{"signature", ColumnType::kText},
    RecordColumn{"path", ColumnType::kText},
};
inline constexpr std::array kLossColumns{
    RecordColumn{"piece", ColumnType::kText},
    RecordColumn{"reason", ColumnType::kText},
    RecordColumn{"count", ColumnType::kInteger},
};

inline constexpr RecordTable kIssueMetrics{.records = "issue_metric_records",
                                           .spans = "issue_metric_spans",
                                           .columns = kIssueMetricColumns,
                                           .nameColumn = kNoColumn,
                                           .sinceVersion = 2,
                                           .piece = "metrics"};
inline constexpr RecordTable kPowerEvents{.records = "power_event_records",
                                          .spans = "power_event_spans",
                                          .columns = kPowerEventColumns,
                                          .nameColumn = kPowerEventName,
                                          .sinceVersion = 2,
                                          .piece = "power log"};
inline constexpr RecordTable kLinkMessages{.records = "link_message_records",
                                           .spans = "link_message_spans",
                                           .columns = kLinkMessageColumns,
                                           .nameColumn = kLinkServiceName,
                                           .sinceVersion = 2,
                                           .piece = "link local"};
inline constexpr RecordTable kSnapshots{.records = "snapshot_records",
                                        .spans = "snapshot_spans",
                                        .columns = kSnapshotColumns,
                                        .nameColumn = kNoColumn,
                                        .sinceVersion = 2,
                                        .piece = "snapshots"};
inline constexpr RecordTable kLosses{.records = "loss_records",
                                     .spans = "loss_spans",
                                     .columns = kLossColumns,
                                     .nameColumn = kLossPiece,
                                     .sinceVersion = 4,
                                     .piece = "losses"};

}  // namespace halvox::platform::linux_
