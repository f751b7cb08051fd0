#pragma once

#include <functional>
#include <string>
#include <string_view>

#include "platform/value.h"

namespace halvox::platform {

// Builds the payload of one event. The service calls it on a thread of its own, perhaps after the
// sender has returned; for an event that is dropped it is never called. It must therefore own
// everything that it reads: captures by reference would dangle.
using AnalyticsPayloadBuilder = std::function<Dictionary()>;

// Collects named events.
//
// There are two steps: a cheap test of the name, then a builder that runs on another thread.
// Building and encoding a payload is expensive, and not every event is collected.
//
// Any thread may call. The composition root owns the service. A failure of storage is not reported
// to the caller: the service counts the events that it drops, and logs them.
class AnalyticsService {
 public:
  virtual ~AnalyticsService() = default;

  // Whether anyone collects events of that name. It must be cheap, because it is called for every
  // message.
  [[nodiscard]] virtual bool isAnalyticsEventUsed(std::string_view eventName) = 0;

  // Records one event. Events of one thread are recorded in the order of its calls. The call never
  // waits for the disk. When more events are pending than the service may hold, it waits until
  // there is room: slowing the sender keeps memory bounded without losing what it sent.
  virtual void sendAnalyticsEventLazy(std::string eventName, AnalyticsPayloadBuilder builder) = 0;
};

}  // namespace halvox::platform
