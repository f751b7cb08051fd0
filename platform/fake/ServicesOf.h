#pragma once

#include "platform/services.h"

namespace halvox::platform {

// Returns references to all services of a struct whose members have the names of Services, such as
// FakePlatform, but with another analytics service. The struct and `analytics` must outlive every
// use of the result.
template <typename Platform>
[[nodiscard]] Services servicesOf(Platform& platform, AnalyticsService& analytics) {
  return {.analytics = analytics,
          .clock = platform.clock,
          .connections = platform.connections,
          .deviceProperties = platform.deviceProperties,
          .diagnosticReporters = platform.diagnosticReporters,
          .dispatch = platform.dispatch,
          .featureFlags = platform.featureFlags,
          .files = platform.files,
          .ioReport = platform.ioReport,
          .kdebug = platform.kdebug,
          .ktrace = platform.ktrace,
          .log = platform.log,
          .metrics = platform.metrics,
          .notify = platform.notify,
          .overflow = platform.overflow,
          .performanceTraces = platform.performanceTraces,
          .powerLog = platform.powerLog,
          .preferences = platform.preferences,
          .privacy = platform.privacy,
          .process = platform.process,
          .propertyLists = platform.propertyLists,
          .resultsFiles = platform.resultsFiles,
          .statistics = platform.statistics,
          .tlmReporting = platform.tlmReporting};
}

}  // namespace halvox::platform
