#pragma once

#include <cstdint>

#include "platform/protobuf.h"

namespace halvox::platform {

// Collects structured metrics in their protocol-buffers form.
//
// Any thread may call. A failure of storage is not reported to the caller: the service counts what
// it drops, and logs it. The composition root owns the service.
class MetricService {
 public:
  virtual ~MetricService() = default;

  // Records the message's encoded bytes under that identifier. Encodes before it returns and does
  // not keep the message. Never waits for the disk; when more records are pending than the service
  // may hold, it waits until there is room.
  virtual void postIssueMetric(std::uint32_t metricID, const ProtoBase& message) = 0;
};

}  // namespace halvox::platform
