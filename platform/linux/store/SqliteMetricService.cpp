#include "platform/linux/store/SqliteMetricService.h"

namespace halvox::platform::linux_ {

void SqliteMetricService::postIssueMetric(std::uint32_t metricID, const ProtoBase& message) {
  ProtoWriter writer;
  message.writeTo(writer);
  records_.add({.time = clock_.currentDate().secondsSince1970,
                .metricID = metricID,
                .message = {writer.bytes().begin(), writer.bytes().end()}});
}

}  // namespace halvox::platform::linux_
