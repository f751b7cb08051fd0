#pragma once

#include <cstdint>

#include "platform/protobuf.h"

namespace halvox::platform {

// Collects structured metrics. Any thread may call.
class MetricService {
 public:
  virtual ~MetricService() = default;

  // Posts one metric: the message's encoded bytes under that identifier. Does not keep the message.
  // Never waits for storage to be written; waits for room when more are pending than may be held.
  virtual void postIssueMetric(std::uint32_t metricID, const ProtoBase& message) = 0;
};

}  // namespace halvox::platform
