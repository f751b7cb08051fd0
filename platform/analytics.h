#pragma once

#include <functional>
#include <string>
#include <string_view>

#include "platform/value.h"

namespace halvox::platform {

// Builds the payload of one event. The service calls the builder on a thread of its own, perhaps
// after sendAnalyticsEventLazy() has returned. It never calls the builder of an event that it
// drops. The builder must own everything that it reads, because captures by reference could dangle
// by then.
using AnalyticsPayloadBuilder = std::function<Dictionary()>;

// Collects named events.
//
// A sender first tests the name of the event, which is cheap. It then passes a builder for the
// payload, which runs on another thread. Building and encoding a payload is expensive, and not
// every event is collected.
//
// Any thread may call. The composition root owns the service. A failure of storage is not reported
// to the caller. The service counts the events that it drops, and logs them.
class AnalyticsService {
 public:
  virtual ~AnalyticsService() = default;

  // True if anyone collects events of that name. The test must be cheap, because senders make it
  // for every message.
  [[nodiscard]] virtual bool isAnalyticsEventUsed(std::string_view eventName) = 0;

  // Records one event. The service records the events of one thread in the order of its calls. The
  // call does not wait until the event is on the disk. While the service holds its maximum of
  // pending events, the call blocks, because slowing the sender keeps memory bounded without losing
  // events.
  virtual void sendAnalyticsEventLazy(std::string eventName, AnalyticsPayloadBuilder builder) = 0;
};

}  // namespace halvox::platform
