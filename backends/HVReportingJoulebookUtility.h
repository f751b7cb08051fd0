#pragma once

#include <memory>

#include "backends/HVReportingVocabulary.h"
#include "platform/value.h"

namespace halvox {

class HVReportingSession;

// Hands what costs energy to the power log: how long a haptics engine was on, and haptics sessions
// that were left running. Keeps no state; any thread. Reports no failure: what an engine report
// lacks is logged, and left out.
class HVReportingJoulebookUtility {
 public:
  HVReportingJoulebookUtility() = delete;

  // Logs at most one power event for a message of type kJoulebook of a session, which is not null:
  // of the engine when the message tells of both. Does nothing for any other message, or for none.
  // The category does not matter. Values reach the power log as they came.
  static void handleEvent(const platform::Message& message, AudioEventCategory category,
                          AudioEventType type, const std::shared_ptr<HVReportingSession>& session);
};

}  // namespace halvox
