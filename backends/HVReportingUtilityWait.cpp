#include <algorithm>
#include <chrono>

#include "backends/HVReportingUtility.h"
#include "platform/log.h"

namespace halvox {
namespace {

constexpr std::string_view kUnit = "HVReportingUtility";

// A time-out as a clock can add it: longer ones mean "for ever", a NaN or negative one "not at
// all".
std::chrono::nanoseconds boundedTimeout(double seconds) {
  constexpr double kForEver = 1e9;  // some thirty years
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
  // The lines are logged under the lock, so that they stand in the order of what happened.
  std::unique_lock lock(condition.mutex);
  while (!*flag) {
    UnitLog::logTo(logCategory, kUnit, LogLevel::kInfo, "", waitingMessage);
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
