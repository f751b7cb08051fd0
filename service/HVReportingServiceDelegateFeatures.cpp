#include <string>
#include <utility>

#include "backends/PrivacyFilter.h"
#include "platform/clock.h"
#include "platform/notify.h"
#include "platform/preferences.h"
#include "platform/services.h"
#include "service/HVReportingClientServerInstance.h"
#include "service/HVReportingServiceDelegate.h"
#include "service/NSUserDefaults.h"
#include "service/ReportingQueue.h"
#include "service/RoundedSeconds.h"
#include "service/ServiceLog.h"

// The settings that the service reads from the settings store: the defaults, once, and the watched
// features, each time their state is needed.
namespace halvox {
namespace {

using platform::Dictionary;

constexpr std::string_view kOwnDomain = "com.tarno.halvox";
// The user whose settings are read.
constexpr std::string_view kUserName = "mobile";

// Keys of a feature descriptor.
constexpr std::string_view kDefaultsDomainKey = "defaults_domain";
constexpr std::string_view kFeatureDomainKey = "feature_domain";
constexpr std::string_view kNotificationKey = "notification";
constexpr std::string_view kNotifyTokenKey = "notify_token";
// Names of settings.
constexpr std::string_view kDeviceNameKey = "device_name";
constexpr std::string_view kDisableReportingKey = "disable_reporting";

constexpr platform::NotifyToken kNoToken = 0;

// The text under a key of a descriptor; empty if there is none.
std::string_view text(const Dictionary& descriptor, std::string_view key) {
  const platform::Value* value = descriptor.find(key);
  return value == nullptr ? std::string_view() : value->string();
}

void stamp(Dictionary& state) {
  const platform::ClockService& clock = platform::clock();
  state.set("hvreporting_timestamp", clock.currentDate().secondsSince1970);
  state.set("systemuptime_sec", roundedSeconds(clock.systemUptime()));
}

}  // namespace

Dictionary HVReportingServiceDelegate::HVReportingDefaults() {
  const NSUserDefaults store(kOwnDomain);
  Dictionary defaults;
  if (store.objectForKey(kDeviceNameKey).has_value()) {
    // A value without a text counts as missing.
    if (auto name = store.stringForKey(kDeviceNameKey)) defaults.set(kDeviceNameKey, *name);
  }
  // In spite of its name the value disables nothing: it is only passed on. Without a setting it is
  // the number 0, not false. Both are required.
  if (store.objectForKey(kDisableReportingKey).has_value()) {
    defaults.set(kDisableReportingKey, store.boolForKey(kDisableReportingKey));
  } else {
    defaults.set(kDisableReportingKey, 0);
  }
  applyPrivacy(defaults);
  return defaults;
}

HVReportingServiceDelegate::Features HVReportingServiceDelegate::makeFeatures() {
  return {{{kDefaultsDomainKey, "com.tarno.pavisk"},
           {kFeatureDomainKey, "spatial-audio-accessory-feature"},
           {kNotificationKey, "com.tarno.pavisk.spatial-audio-accessory-feature.changed"}},
          {{kDefaultsDomainKey, kOwnDomain},
           {kFeatureDomainKey, kDeviceNameKey},
           {kNotificationKey, gReportingNotifydNotificationName}}};
}

platform::Message HVReportingServiceDelegate::getFeaturesState() const {
  kServiceLog.notice("getting features");
  Dictionary state;
  for (const Dictionary& descriptor : features_) {
    const std::string_view domain = text(descriptor, kDefaultsDomainKey);
    const std::string_view feature = text(descriptor, kFeatureDomainKey);
    if (domain.empty() || feature.empty()) continue;
    auto value = platform::preferences().CFPreferencesCopyValue(feature, domain, kUserName);
    if (value.has_value()) state.set(feature, *std::move(value));
  }
  applyPrivacy(state);
  // Tested before the time stamps are added, because they are not settings.
  if (state.empty()) return std::nullopt;
  stamp(state);
  return state;
}

void HVReportingServiceDelegate::listenForFeatureStateChanges() {
  kServiceLog.info("listening for features ",
                   ListDescription(features_, [](std::string& line, const Dictionary& descriptor) {
                     line += platform::describe(descriptor);
                   }));
  for (Dictionary& descriptor : features_) {
    const std::string_view notification = text(descriptor, kNotificationKey);
    if (text(descriptor, kDefaultsDomainKey).empty() || notification.empty()) continue;
    platform::NotifyToken token = kNoToken;
    // The registration is never cancelled: it lasts for the life of the process, like this object.
    // Only tests drop a delegate earlier, and for them the handler checks `alive`.
    const platform::NotifyStatus status = platform::notify().notify_register_dispatch(
        notification, token, reportingQueue(),
        [this, alive = std::weak_ptr<const bool>(alive_)](platform::NotifyToken fired) {
          if (!alive.expired()) handleFeatureChange(fired);
        });
    // The token of a failed registration, which is 0, is stored too. A failed registration is not
    // tried again; this is required.
    descriptor.set(kNotifyTokenKey, token);
    kServiceLog.notice("notify setup result ", status, " token ", token);
  }
}

// Sends the state even if no watched setting has a value, so that sessions learn that the last
// setting was removed. The start of a session sends nothing in this case. Both rules are required.
void HVReportingServiceDelegate::handleFeatureChange(platform::NotifyToken token) {
  kServiceLog.info("feature ", token, " changes");
  const platform::Message state = getFeaturesState();
  kServiceLog.info("defaults ", state);
  for (const Client& client : clients_) {
    for (const auto& [reporterID, session] : client->clientReportingSessionMap()) {
      session->sendMessage(state, AudioEventCategory::kSetup, AudioEventType::kSetup, nullptr);
    }
  }
}

}  // namespace halvox
