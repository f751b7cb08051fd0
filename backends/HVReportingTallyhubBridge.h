#pragma once

#include <memory>

#include "backends/HVReportingVocabulary.h"
#include "platform/value.h"

namespace halvox {

class HVReportingSession;

// Forwards each message to the analytics service as up to two events. One is named after the
// message's category and type, the other also after the session's service. Keeps no state; any
// thread may call. Returns no error; an event that nobody collects is not sent.
class HVReportingTallyhubBridge {
 public:
  HVReportingTallyhubBridge() = delete;

  // Sends the events of one message, of any category and type. `session` must not be null.
  //
  // The payload is a copy of the message (empty without a message) with the name of the application
  // from the session's configuration. The analytics service builds it later, possibly on another
  // thread. Each event therefore holds the message and the session, and a configuration that
  // changed meanwhile is seen in its new state.
  static void handleEvent(const platform::Message& message, AudioEventCategory category,
                          AudioEventType type, const std::shared_ptr<HVReportingSession>& session);
};

}  // namespace halvox
