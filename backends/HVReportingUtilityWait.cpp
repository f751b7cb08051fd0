#include <algorithm>
#include <chrono>

#include "backends/HVReportingUtility.h"
#include "platform/log.h"

namespace halvox {
namespace {

constexpr std::string_view kUnit = "HVReportingUtility";

// Returns a time-out that a clock can add without overflow. A longer one becomes 1e9 seconds, which
// is about thirty years; NaN and negative ones become 0.
std::chrono::nanoseconds boundedTimeout(double seconds) {
  constexpr double kForEver = 1e9;
  const double bounded = seconds > 0 ? std::min(seconds, kForEver) : 0;
  return std::chrono::duration_cast<std::chrono::nanoseconds>(
      std::chrono::duration<double>(bounded));
}

}  // namespace

bool HVReportingUtilityWait(HVReportingUtilityCondition& condition, double timeoutSeconds,
                            const bool* flag, std::string_view waitingMessage,
                            std::string_view timeoutMessage, platform::LogCategory& logCategory) {
  using platform::LogLevel;
  using platform::UnitLog;
  // Log under the lock, so that the lines are in the order of the events.
  std::unique_lock lock(condition.mutex);
  while (!*flag) {
    UnitLog::logTo(logCategory, kUnit, LogLevel::kInfo, "", waitingMessage);
    // Computed again on each turn, because a wake-up must restart the time-out. This is required.
    const auto timeout = boundedTimeout(timeoutSeconds);
    if (condition.condition.wait_for(lock, timeout) == std::cv_status::timeout) {
      UnitLog::logTo(logCategory, kUnit, LogLevel::kError, "", timeoutMessage);
      return false;
    }
    UnitLog::logTo(logCategory, kUnit, LogLevel::kInfo, "continuing");
  }
  return true;
}

void HVReportingUtilitySignal(HVReportingUtilityCondition& condition, bool* flag) {
  const std::lock_guard lock(condition.mutex);
  *flag = true;
  condition.condition.notify_one();
}

}  // namespace halvox
