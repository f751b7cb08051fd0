#include "platform/linux/store/SqliteAnalyticsService.h"

#include <utility>

namespace halvox::platform::linux_ {

bool SqliteAnalyticsService::isAnalyticsEventUsed(std::string_view eventName) {
  const EventName* const known = names_.find(eventName);
  return known != nullptr ? known->isWanted : names_.matches(eventName);
}

void SqliteAnalyticsService::sendAnalyticsEventLazy(std::string_view eventName,
                                                    AnalyticsPayloadBuilder builder) {
  records_.addEvent(clock_.currentDate().secondsSince1970, eventName, std::move(builder));
}

}  // namespace halvox::platform::linux_
