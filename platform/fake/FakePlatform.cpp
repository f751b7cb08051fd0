#include "platform/fake/FakePlatform.h"

namespace halvox::platform {

FakePlatform::FakePlatform() { installServices(servicesWith(analytics)); }

Services FakePlatform::servicesWith(AnalyticsService& otherAnalytics) {
  return {.analytics = otherAnalytics,
          .clock = clock,
          .connections = connections,
          .deviceProperties = deviceProperties,
          .diagnosticReporters = diagnosticReporters,
          .dispatch = dispatch,
          .featureFlags = featureFlags,
          .files = files,
          .ioReport = ioReport,
          .kdebug = kdebug,
          .ktrace = ktrace,
          .log = log,
          .metrics = metrics,
          .notify = notify,
          .performanceTraces = performanceTraces,
          .powerLog = powerLog,
          .preferences = preferences,
          .process = process,
          .propertyLists = propertyLists,
          .resultsFiles = resultsFiles,
          .statistics = statistics,
          .tlmReporting = tlmReporting};
}

FakePlatform::~FakePlatform() {
  connections.clear();
  tlmReporting.clear();
  notify.clear();
  dispatch.clear();
  analytics.clear();
  dispatch.clear();
}

}  // namespace halvox::platform
