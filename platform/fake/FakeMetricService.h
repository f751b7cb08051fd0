#pragma once

#include <cstddef>
#include <cstdint>
#include <mutex>
#include <vector>

#include "platform/fake/Journal.h"
#include "platform/metrics.h"

namespace halvox::platform {

// Keeps the metrics that were posted. Any thread may call the service; only the test's thread reads
// the results. FakePlatform owns it.
class FakeMetricService final : public MetricService {
 public:
  struct Metric {
    std::uint32_t metricID;
    std::vector<std::byte> bytes;  // the message as it was encoded
    friend bool operator==(const Metric&, const Metric&) = default;
  };

  // Does not own the journal, which must outlive it.
  explicit FakeMetricService(Journal& journal) : journal_(journal) {}

  [[nodiscard]] std::vector<Metric> metrics() const;

  void postIssueMetric(std::uint32_t metricID, const ProtoBase& message) override;

 private:
  Journal& journal_;
  mutable std::mutex mutex_;
  std::vector<Metric> metrics_;
};

}  // namespace halvox::platform
