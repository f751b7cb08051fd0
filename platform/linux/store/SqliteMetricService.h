#pragma once

#include "platform/clock.h"
#include "platform/linux/store/SqliteStore.h"
#include "platform/metrics.h"

namespace halvox::platform::linux_ {

// Records metrics in the store with the time of the call. Any thread may call. Does not own the
// store and the clock, which must outlive it. Failures of the store are counted and logged there
// and never reach the caller.
class SqliteMetricService final : public MetricService {
 public:
  SqliteMetricService(SqliteStore& store, const ClockService& clock)
      : records_(store.issueMetrics()), clock_(clock) {}

  // Encodes the message before it returns.
  void postIssueMetric(std::uint32_t metricID, const ProtoBase& message) override;

 private:
  IssueMetricRecords& records_;
  const ClockService& clock_;
};

}  // namespace halvox::platform::linux_
