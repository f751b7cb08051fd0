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

Dictionary enginePayload(const Dictionary& message, const Value& onTime,
                         const HVReportingSession& session) {
  static const Key duration("EngineOnDuration");
  static const Key application("ApplicationName");
  static const Key timestamp("hvreporting_timestamp");
  static const Key end("TimestampEnd");
  Dictionary payload;
  payload.set(duration, onTime);
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

Dictionary leakPayload(const Dictionary& message, const Key& key, const Value& activeTime) {
  static const Key clients("Active_Clients");
  Dictionary payload;
  payload.set(key, activeTime);
  // Unlike a missing time stamp, a missing number of clients is not logged; this is required.
  if (const Value* active = message.find(clients)) payload.set(clients, *active);
  return payload;
}

void logEvent(std::string_view name, const Dictionary& payload) {
  platform::powerLog().logPowerEvent(kPowerLogCategory, name, payload, std::nullopt);
}

}  // namespace

void HVReportingJoulebookUtility::handleEvent(const platform::Message& message,
                                              AudioEventCategory /*category*/, AudioEventType type,
                                              const std::shared_ptr<HVReportingSession>& session,
                                              const PowerLogCounters& counters) {
  if (type != AudioEventType::kJoulebook || !message.has_value()) return;
  static const Key engineOnTime("EngineOnTime");
  static const Key activeTime("Haptic_Active_Hardware_Time_Seconds");
  counters.received.add();
  // A message with both keys is an engine report only; this is required.
  if (const Value* onTime = message->find(engineOnTime)) {
    logEvent(kEngineEvent, enginePayload(*message, *onTime, *session));
    counters.delivered.add();
  } else if (const Value* leaked = message->find(activeTime)) {
    logEvent(kLeakEvent, leakPayload(*message, activeTime, *leaked));
    counters.delivered.add();
  } else {
    counters.unknown.add();
  }
}

}  // namespace halvox
