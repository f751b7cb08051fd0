#include "platform/services.h"

#include <cstdio>
#include <cstdlib>
#include <optional>

namespace halvox::platform {
namespace {

// A static variable of a function, not a global one, because static initialisers of other files may
// call this function before the globals of this file exist.
std::optional<Services>& slot() {
  static std::optional<Services> services;
  return services;
}

const Services& installed() {
  if (!slot().has_value()) {
    // The message cannot be logged, because the log is one of the services that are missing.
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
DiagnosticReporterService& diagnosticReporters() { return installed().diagnosticReporters; }
DispatchService& dispatch() { return installed().dispatch; }
FeatureFlagService& featureFlags() { return installed().featureFlags; }
FileService& files() { return installed().files; }
IOReportService& ioReport() { return installed().ioReport; }
KdebugService& kdebug() { return installed().kdebug; }
KtraceService& ktrace() { return installed().ktrace; }
LogService& log() { return installed().log; }
MetricService& metrics() { return installed().metrics; }
NotifyService& notify() { return installed().notify; }
OverflowService& overflow() { return installed().overflow; }
PerformanceTraceService& performanceTraces() { return installed().performanceTraces; }
PowerLogService& powerLog() { return installed().powerLog; }
PreferenceService& preferences() { return installed().preferences; }
PrivacyService& privacy() { return installed().privacy; }
ProcessService& process() { return installed().process; }
PropertyListService& propertyLists() { return installed().propertyLists; }
ResultsFileService& resultsFiles() { return installed().resultsFiles; }
StatisticsService& statistics() { return installed().statistics; }
TLMReportingService& tlmReporting() { return installed().tlmReporting; }

}  // namespace halvox::platform
