#include "session/SessionProfile.h"

#include <utility>

#include "backends/HVReportingUtility.h"
#include "session/SessionLog.h"

namespace halvox {

SessionProfile::SessionProfile(ReporterID reporterID, ProcessIdentifiers processIdentifiers,
                               ResourceTally& held)
    : reporterID_(reporterID), held_(held), processIdentifiers_(std::move(processIdentifiers)) {}

void SessionProfile::setProcessIdentifiers(ProcessIdentifiers identifiers) {
  processIdentifiers_.set(std::move(identifiers));
}

platform::ProcessID SessionProfile::ownerPid() const {
  const auto owners = processIdentifiers_.lock();
  return owners->empty() ? 0 : owners->front();
}

void SessionProfile::setServiceType(AudioServiceType serviceType) {
  serviceType_.store(serviceType, std::memory_order_relaxed);
  kSessionLog.info("setting service type ", serviceName());
}

// The name is looked up on every call instead of stored. A reader therefore never sees a type with
// the name of another. A new session needs no special case: its type is kUnknown and its name is
// "unknown".
std::string_view SessionProfile::serviceName() const {
  return HVReportingUtilityGenerateServiceNameFromServiceType(serviceType());
}

void SessionProfile::mergeConfiguration(const platform::Dictionary& configuration) {
  const auto current = configuration_.lock();
  const std::size_t before = current->memorySize();
  current->merge(configuration);
  held_.change(before, current->memorySize());
}

}  // namespace halvox
