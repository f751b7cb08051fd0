#include "platform/services.h"

#include <cstdio>
#include <cstdlib>
#include <optional>

namespace halvox::platform {
namespace {

std::optional<Services>& slot() {
  static std::optional<Services> services;
  return services;
}

const Services& installed() {
  if (!slot().has_value()) {
    std::fputs("halvox: a platform service was used before the services were installed\n", stderr);
    std::abort();
  }
  return *slot();
}

}  // namespace

void installServices(const Services& services) { slot().emplace(services); }

AnalyticsService& analytics() { return installed().analytics; }
ClockService& clock() { return installed().clock; }
ConnectionService& connections() { return installed().connections; }
DevicePropertyService& deviceProperties() { return installed().deviceProperties; }
DispatchService& dispatch() { return installed().dispatch; }
FeatureFlagService& featureFlags() { return installed().featureFlags; }
KdebugService& kdebug() { return installed().kdebug; }
LogService& log() { return installed().log; }
ProcessService& process() { return installed().process; }
StatisticsService& statistics() { return installed().statistics; }

}  // namespace halvox::platform
