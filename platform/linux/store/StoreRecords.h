#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "platform/linux/store/SimpleRecords.h"
#include "platform/value.h"

namespace halvox::platform::linux_ {

// The records that have a row each, as callers queue them. All are plain values. `time` is seconds
// since 1970. Payloads wait as dictionaries, because the writer encodes them and the callers'
// threads are spared that work.
//
// `bind` passes the columns of a record to the statement that inserts it, and returns the number of
// bytes that count against the transaction. The record must outlive the statement's run.

struct IssueMetricRecord {
  static constexpr const RecordTable& table = kIssueMetrics;
  double time = 0;
  std::uint32_t metricID = 0;
  std::vector<std::byte> message{};

  std::size_t bind(Statement& statement, int firstColumn, PayloadEncoder& encoder) const;
};

struct PowerEventRecord {
  static constexpr const RecordTable& table = kPowerEvents;
  double time = 0;
  std::uint32_t categoryID = 0;
  std::string eventName;
  Dictionary payload{};

  std::size_t bind(Statement& statement, int firstColumn, PayloadEncoder& encoder) const;
};

struct SnapshotRecord {
  static constexpr const RecordTable& table = kSnapshots;
  double time = 0;
  Dictionary signature{};
  std::string path;

  std::size_t bind(Statement& statement, int firstColumn, PayloadEncoder& encoder) const;
};

using IssueMetricRecords = SimpleRecords<IssueMetricRecord>;
using PowerEventRecords = SimpleRecords<PowerEventRecord>;
using SnapshotRecords = SimpleRecords<SnapshotRecord>;

}  // namespace halvox::platform::linux_
