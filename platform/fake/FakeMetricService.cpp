#include "platform/fake/FakeMetricService.h"

#include <string>

namespace halvox::platform {

std::vector<FakeMetricService::Metric> FakeMetricService::metrics() const {
  const std::lock_guard lock(mutex_);
  return metrics_;
}

void FakeMetricService::postIssueMetric(std::uint32_t metricID, const ProtoBase& message) {
  ProtoWriter writer;
  message.writeTo(writer);
  journal_.record(JournalKind::kMetric, std::to_string(metricID));
  const std::lock_guard lock(mutex_);
  metrics_.push_back({metricID, {writer.bytes().begin(), writer.bytes().end()}});
}

}  // namespace halvox::platform
