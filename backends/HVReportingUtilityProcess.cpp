#include <utility>

#include "backends/HVReportingUtility.h"
#include "platform/device_properties.h"
#include "platform/services.h"

namespace halvox {

bool HVReportingInternalBuildAnswer::isInternalBuild() {
  std::call_once(once_, [this] {
    const auto answer = platform::deviceProperties().copyDeviceProperty("InternalBuild");
    if (!answer.has_value() || !answer->isNumber()) return;
    // A number such as 1 is not a boolean and counts as no answer.
    if (answer->numberKind() == platform::NumberKind::kBool) internalBuild_ = answer->toBool();
  });
  return internalBuild_;
}

bool HVReportingUtilityIsInternalBuild() {
  static HVReportingInternalBuildAnswer answer;
  return answer.isInternalBuild();
}

bool HVReportingUtilityProcessInfoForPID(platform::ProcessID pid, platform::ProcessRecord& record) {
  std::optional<platform::ProcessRecord> found = platform::process().processRecord(pid);
  if (!found.has_value()) return false;
  record = std::move(*found);
  return true;
}

std::optional<std::string> HVReportingUtilityProcessNameForPID(platform::ProcessID pid) {
  if (pid == platform::process().ownProcessIdentifier()) {
    return platform::process().ownProcessName();
  }
  platform::ProcessRecord record;
  if (pid < 1 || !HVReportingUtilityProcessInfoForPID(pid, record)) return std::nullopt;
  return std::move(record.commandName);
}

}  // namespace halvox
