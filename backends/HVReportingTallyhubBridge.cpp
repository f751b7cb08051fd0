#include "backends/HVReportingTallyhubBridge.h"

#include <string_view>
#include <utility>

#include "backends/HVReportingEventNames.h"
#include "backends/HVReportingUtility.h"
#include "platform/analytics.h"
#include "platform/services.h"
#include "session/HVReportingSession.h"

namespace halvox {

using platform::AnalyticsPayload;
using platform::Dictionary;
using platform::Key;
using platform::Message;

namespace {

// `message` shares its entries with the messages of the other bridges and of the session until it
// is changed here.
AnalyticsPayload makePayload(const Dictionary& message, const HVReportingSession& session) {
  static const Key key("HostApplicationDisplayID");
  Dictionary payload = message;
  platform::Value name = HVReportingUtilityRetrieveAppName(session.configuration());
  if (payload.find(key) == nullptr) return {std::move(payload), {key, std::move(name)}};
  // Replaces what the message itself has under this key, because only the session's configuration
  // counts. This is required.
  payload.set(key, std::move(name));
  return payload;
}

void sendIfUsed(std::string_view name, const Message& message,
                const std::shared_ptr<HVReportingSession>& session) {
  platform::AnalyticsService& analytics = platform::analytics();
  if (!analytics.isAnalyticsEventUsed(name)) return;
  // The captures are copies without const. A plain capture of a const reference would be a const
  // member, which cannot be moved, and the builder would be allocated for each event.
  auto builder = [entries = message.value_or(Dictionary()), session = std::shared_ptr(session)] {
    return makePayload(entries, *session);
  };
  static_assert(platform::AnalyticsPayloadBuilder::holdsInside<decltype(builder)>());
  analytics.sendAnalyticsEventLazy(name, std::move(builder));
}

}  // namespace

void HVReportingTallyhubBridge::handleEvent(const Message& message, AudioEventCategory category,
                                            AudioEventType type,
                                            const std::shared_ptr<HVReportingSession>& session) {
  const HVReportingEventNames names(category, type, session->serviceType());
  // This order is required. Send nothing between the two, because the store keeps consecutive
  // events with equal payloads as one record.
  sendIfUsed(names.ofAll.text(), message, session);
  sendIfUsed(names.ofService.text(), message, session);
}

}  // namespace halvox
