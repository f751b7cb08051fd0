#include "backends/HVReportingJoulebookUtility.h"

#include <cstdint>
#include <string_view>

#include "backends/BackEndCounters.h"
#include "backends/HVReportingUtility.h"
#include "platform/log.h"
#include "platform/power_log.h"
#include "platform/services.h"
#include "session/HVReportingSession.h"

namespace halvox {

using platform::Dictionary;
using platform::Key;
using platform::Value;

namespace {

constexpr platform::UnitLog kLog(&HVReportingJoulebookCategory, "HVReportingJoulebookUtility");

// Fixed by the interface, like the names below.
constexpr std::uint32_t kPowerLogCategory = 28;
constexpr std::string_view kEngineEvent = "Oxbow_Haptics";
constexpr std::string_view kLeakEvent = "LeakedHapticsSessionInfo";

// The keys by which a message is recognised.
const Key& engineOnTimeKey() {
  static const Key key("EngineOnTime");
  return key;
}
const Key& activeTimeKey() {
  static const Key key("Haptic_Active_Hardware_Time_Seconds");
  return key;
}

// The message must have the key of the report.
Dictionary enginePayload(const Dictionary& message, const HVReportingSession& session) {
  static const Key duration("EngineOnDuration");
  static const Key application("ApplicationName");
  static const Key timestamp("hvreporting_timestamp");
  static const Key end("TimestampEnd");
  Dictionary payload;
  payload.set(duration, *message.find(engineOnTimeKey()));
  const Value appName = HVReportingUtilityRetrieveAppName(session.configuration());
  // Always true, because the name defaults to "Unknown". The test and its log line are nevertheless
  // required.
  if (appName != Value()) {
    payload.set(application, appName);
  } else {
    kLog.error("failed to get app name for joulebook");
  }
  if (const Value* time = message.find(timestamp)) {
    payload.set(end, *time);
  } else {
    kLog.error("failed to get HVReporting timestamp for joulebook");
  }
  return payload;
}

Dictionary leakPayload(const Dictionary& message) {
  static const Key clients("Active_Clients");
  Dictionary payload;
  payload.set(activeTimeKey(), *message.find(activeTimeKey()));
  // Unlike a missing time stamp, a missing number of clients is not logged; this is required.
  if (const Value* active = message.find(clients)) payload.set(clients, *active);
  return payload;
}

}  // namespace

std::optional<std::string_view> HVReportingJoulebookUtility::eventOf(
    const platform::Message& message, AudioEventType type) {
  if (type != AudioEventType::kJoulebook || !message.has_value()) return std::nullopt;
  // A message with both keys is an engine report only; this is required.
  if (message->find(engineOnTimeKey()) != nullptr) return kEngineEvent;
  if (message->find(activeTimeKey()) != nullptr) return kLeakEvent;
  return std::nullopt;
}

void HVReportingJoulebookUtility::handleEvent(const platform::Message& message,
                                              AudioEventCategory /*category*/, AudioEventType type,
                                              const std::shared_ptr<HVReportingSession>& session,
                                              const PowerLogCounters& counters) {
  if (type != AudioEventType::kJoulebook || !message.has_value()) return;
  counters.received.add();
  const auto event = eventOf(message, type);
  if (!event) return counters.unknown.add();
  platform::powerLog().logPowerEvent(
      kPowerLogCategory, *event,
      *event == kEngineEvent ? enginePayload(*message, *session) : leakPayload(*message),
      std::nullopt);
  counters.delivered.add();
}

}  // namespace halvox
