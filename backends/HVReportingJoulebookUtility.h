#pragma once

#include <memory>
#include <optional>
#include <string_view>

#include "backends/HVReportingVocabulary.h"
#include "platform/value.h"

namespace halvox {

class HVReportingSession;
struct PowerLogCounters;

// Forwards reports about energy use to the power log: how long a haptics engine was on, and haptics
// sessions that were left running ("leaked"). Keeps no state; any thread may call. Returns no
// error: a key that an engine report lacks is logged and omitted from the event.
class HVReportingJoulebookUtility {
 public:
  HVReportingJoulebookUtility() = delete;

  // Returns the name of the power event that a message makes; std::nullopt if it makes none.
  static std::optional<std::string_view> eventOf(const platform::Message& message,
                                                 AudioEventType type);

  // Logs at most one power event for a message of type kJoulebook. If a message reports both, the
  // engine takes precedence. Ignores messages of other types and a missing message. Does not use
  // the category. Values reach the power log unchanged. `session` must not be null.
  static void handleEvent(const platform::Message& message, AudioEventCategory category,
                          AudioEventType type, const std::shared_ptr<HVReportingSession>& session,
                          const PowerLogCounters& counters);
};

}  // namespace halvox
