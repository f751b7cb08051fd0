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
          .kdebug = kdebug,
          .log = log,
          .metrics = metrics,
          .notify = notify,
          .powerLog = powerLog,
          .preferences = preferences,
          .process = process,
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
