#pragma once

#include <memory>

#include "backends/HVReportingVocabulary.h"
#include "platform/value.h"

namespace halvox {

class HVReportingSession;

// Hands each message to the analytics service as up to two events, one named from the message's
// category and type and one from the session's service as well. Keeps no state; any thread.
// Reports no failure: a name that nobody collects is not sent.
class HVReportingTallyhubBridge {
 public:
  HVReportingTallyhubBridge() = delete;

  // Sends the events of one message of a session, which is not null. The payload is the message
  // (an empty one when there is none) with the application's name as the session's configuration
  // has it when the payload is built; that may be later and on another thread, so the events hold
  // the message and the session. Takes every category and type. Never changes the message.
  static void handleEvent(const platform::Message& message, AudioEventCategory category,
                          AudioEventType type, const std::shared_ptr<HVReportingSession>& session);
};

}  // namespace halvox
