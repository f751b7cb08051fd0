#include "platform/linux/store/StoreRecords.h"

#include <string_view>

namespace halvox::platform::linux_ {
namespace {

std::string_view bindPayload(Statement& statement, int column, const Dictionary& payload,
                             PayloadEncoder& encoder) {
  const std::string_view text = encoder.encode(payload);
  statement.bind(column, text);
  return text;
}

}  // namespace

std::size_t IssueMetricRecord::bind(Statement& statement, int firstColumn,
                                    PayloadEncoder& /*encoder*/) const {
  statement.bind(firstColumn + kMetricID, std::int64_t{metricID});
  statement.bind(firstColumn + kMetricMessage, std::span<const std::byte>(message));
  return message.size();
}

std::size_t PowerEventRecord::bind(Statement& statement, int firstColumn,
                                   PayloadEncoder& encoder) const {
  statement.bind(firstColumn + kPowerCategory, std::int64_t{categoryID});
  statement.bind(firstColumn + kPowerEventName, std::string_view(eventName));
  return bindPayload(statement, firstColumn + kPowerPayload, payload, encoder).size() +
         eventName.size();
}

std::size_t SnapshotRecord::bind(Statement& statement, int firstColumn,
                                 PayloadEncoder& encoder) const {
  statement.bind(firstColumn + kSnapshotPath, std::string_view(path));
  return bindPayload(statement, firstColumn + kSnapshotSignature, signature, encoder).size() +
         path.size();
}

}  // namespace halvox::platform::linux_
