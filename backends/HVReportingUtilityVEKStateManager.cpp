#include "backends/HVReportingUtilityVEKStateManager.h"

#include <utility>

#include "backends/HVReportingUtility.h"
#include "platform/diagnostic_reporter.h"
#include "platform/log.h"
#include "platform/services.h"
#include "session/HVReportingSession.h"

namespace halvox {

using platform::Dictionary;
using platform::Key;

namespace {

constexpr platform::UnitLog kLog(&HVReportingVEKLogCategory, "HVReportingUtilityVEKStateManager");

constexpr std::string_view kSignatureDomain = "Acoustat";
// The number of counted reports at which the next one causes a snapshot.
constexpr std::uint64_t kReportsBeforeSnapshot = 1;
// The snapshot captures the present state, not a period to come.
constexpr double kSnapshotSeconds = 0;

}  // namespace

HVReportingUtilityVEKStateManager::HVReportingUtilityVEKStateManager(
    platform::StatisticsService& statistics)
    : counters_(statistics) {}

void HVReportingUtilityVEKStateManager::handleEvent(
    const platform::Message& message, AudioEventCategory category, AudioEventType type,
    const std::shared_ptr<HVReportingSession>& session,
    std::optional<std::string_view> processName) {
  if (!concerns(type) || !message.has_value()) return;
  static const Key activeTime("Haptic_Active_Hardware_Time_Seconds");
  if (message->find(activeTime) == nullptr) return;
  counters_.received.add();
  // The comparison includes the time stamps, unlike that of a session's history. A report that a
  // client sends again has new stamps and is not a repetition; the same message for several
  // sessions is one. This is required.
  if (*message == messageCache()) {
    counters_.repeated.add();
    return;
  }
  if (leakedHapticsSessionCounter() == kReportsBeforeSnapshot) {
    takeSnapshot(category, *session, processName);
    counters_.delivered.add();
    return;
  }
  setMessageCache(*message);
  kLog.info("Incrementing VEK counter. ", processName.value_or("(null)"));
  setLeakedHapticsSessionCounter(leakedHapticsSessionCounter() + 1);
  counters_.counted.add();
}

void HVReportingUtilityVEKStateManager::takeSnapshot(AudioEventCategory category,
                                                     const HVReportingSession& session,
                                                     std::optional<std::string_view> processName) {
  kLog.info("Getting snapshot with Ailment Reporter");
  const Reporter reporter = platform::diagnosticReporters().createReporter();
  setAilmentReporter(reporter);
  const Dictionary signature = reporter->makeSignature(
      kSignatureDomain, HVReportingUtilityGenerateServiceNameFromServiceType(session.serviceType()),
      HVReportingUtilityCategoryString(category),
      HVReportingUtilityTypeString(AudioEventType::kJoulebook), processName, std::nullopt);
  reporter->requestSnapshot(
      signature, kSnapshotSeconds, std::nullopt, std::nullopt,
      [](const Dictionary& response) { kLog.info("Response from ailmentReporter : ", response); });
  // Reset only after the request. The second report is not remembered. Both are required.
  setLeakedHapticsSessionCounter(0);
  setMessageCache({});
}

std::uint64_t HVReportingUtilityVEKStateManager::leakedHapticsSessionCounter() const {
  return leakedHapticsSessionCounter_.load(std::memory_order_relaxed);
}

void HVReportingUtilityVEKStateManager::setLeakedHapticsSessionCounter(std::uint64_t count) {
  leakedHapticsSessionCounter_.store(count, std::memory_order_relaxed);
}

HVReportingUtilityVEKStateManager::Reporter HVReportingUtilityVEKStateManager::ailmentReporter()
    const {
  const std::lock_guard held(mutex_);
  return ailmentReporter_;
}

// The parameter takes the old reporter, which is destroyed after the lock has been released.
void HVReportingUtilityVEKStateManager::setAilmentReporter(Reporter reporter) {
  const std::lock_guard held(mutex_);
  std::swap(ailmentReporter_, reporter);
}

Dictionary HVReportingUtilityVEKStateManager::messageCache() const {
  const std::lock_guard held(mutex_);
  return messageCache_;
}

void HVReportingUtilityVEKStateManager::setMessageCache(Dictionary message) {
  const std::lock_guard held(mutex_);
  std::swap(messageCache_, message);
}

}  // namespace halvox
