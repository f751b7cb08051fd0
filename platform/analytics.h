#pragma once

#include <functional>
#include <string>
#include <string_view>

#include "platform/value.h"

namespace halvox::platform {

// Builds the payload of an event when somebody wants it. It must own all that it reads: it may be
// called on another thread and after its maker has returned, or never.
using AnalyticsPayloadBuilder = std::function<Dictionary()>;

// Collects named events. Any thread may call.
class AnalyticsService {
 public:
  virtual ~AnalyticsService() = default;

  // Whether anybody collects events of that name. Cheap: asked for every message.
  [[nodiscard]] virtual bool isAnalyticsEventUsed(std::string_view eventName) = 0;

  // Records one event, in the order of the calls of one thread. Never waits for storage to be
  // written; when more events are pending than the service may hold it waits for room.
  virtual void sendAnalyticsEventLazy(std::string eventName, AnalyticsPayloadBuilder builder) = 0;
};

}  // namespace halvox::platform
