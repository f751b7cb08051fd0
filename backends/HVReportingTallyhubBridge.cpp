#include "backends/HVReportingTallyhubBridge.h"

#include <array>
#include <initializer_list>
#include <string>
#include <string_view>
#include <utility>

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

// Joins the parts of an event name without an allocation, because every message makes two names and
// most of them are only tested, never sent.
class EventName {
 public:
  EventName(std::initializer_list<std::string_view> parts) {
    for (const std::string_view part : parts) {
      length_ += part.copy(text_.data() + length_, text_.size() - length_);
    }
  }
  [[nodiscard]] std::string_view text() const { return {text_.data(), length_}; }

 private:
  // The longest name, with PlaybackAndRecord and HeadphoneAudioExposure, has 75 characters. A name
  // that does not fit would be cut: check this size when a text is added to the vocabulary.
  std::array<char, 128> text_;
  std::size_t length_ = 0;
};

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
  const HVReportingCategoryText categoryText = HVReportingUtilityCategoryTextParts(category);
  const std::string_view typeText = HVReportingUtilityTypeString(type);
  const std::string_view serviceName =
      HVReportingUtilityGenerateServiceNameFromServiceType(session->serviceType());

  const EventName ofAll{"com.tarno.halvox.", categoryText.domain, categoryText.name, ".", typeText};
  const EventName ofService{"com.tarno.",      serviceName, ".",     categoryText.domain,
                            categoryText.name, ".",         typeText};
  // This order is required. Send nothing between the two, because the store keeps consecutive
  // events with equal payloads as one record.
  sendIfUsed(ofAll.text(), message, session);
  sendIfUsed(ofService.text(), message, session);
}

}  // namespace halvox
