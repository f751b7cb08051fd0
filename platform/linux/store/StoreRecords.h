#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include "platform/linux/store/SimpleRecords.h"
#include "platform/value.h"

namespace halvox::platform::linux_ {

// The records of the store that are written as they come. `time` is seconds since 1970; payloads
// are turned into text by the writer.

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

// Who sends through the link: the same for all messages of one session.
struct LinkParty {
  std::int64_t sessionID = 0;
  std::string clientName;
  std::string serviceName;
};

struct LinkMessageRecord {
  static constexpr const RecordTable& table = kLinkMessages;
  double time = 0;
  std::shared_ptr<const LinkParty> party;  // shared by the session and its waiting messages
  std::uint16_t category = 0;
  std::uint16_t type = 0;
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
using LinkMessageRecords = SimpleRecords<LinkMessageRecord>;
using SnapshotRecords = SimpleRecords<SnapshotRecord>;

}  // namespace halvox::platform::linux_
