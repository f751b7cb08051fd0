#pragma once

#include <cstdint>

#include "platform/protobuf.h"

namespace halvox::platform {

// Collects structured metrics in their protocol-buffers form.
//
// Any thread may call. A failure of storage is not reported to the caller. The service counts what
// it drops, and logs it. The composition root owns the service.
class MetricService {
 public:
  virtual ~MetricService() = default;

  // Records the message's encoded bytes under that identifier. Encodes the message before it
  // returns and does not keep it. Does not wait until the record is on the disk, but blocks while
  // the service holds its maximum of pending records.
  virtual void postIssueMetric(std::uint32_t metricID, const ProtoBase& message) = 0;
};

}  // namespace halvox::platform
