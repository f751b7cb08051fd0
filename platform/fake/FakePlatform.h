#pragma once

#include "platform/fake/FakeAnalyticsService.h"
#include "platform/fake/FakeClockService.h"
#include "platform/fake/FakeConnectionService.h"
#include "platform/fake/FakeDevicePropertyService.h"
#include "platform/fake/FakeDiagnosticReporterService.h"
#include "platform/fake/FakeDispatchService.h"
#include "platform/fake/FakeFeatureFlagService.h"
#include "platform/fake/FakeFileService.h"
#include "platform/fake/FakeIOReportService.h"
#include "platform/fake/FakeKdebugService.h"
#include "platform/fake/FakeKtraceService.h"
#include "platform/fake/FakeLogService.h"
#include "platform/fake/FakeMetricService.h"
#include "platform/fake/FakeNotifyService.h"
#include "platform/fake/FakeOverflowService.h"
#include "platform/fake/FakePerformanceTraceService.h"
#include "platform/fake/FakePowerLogService.h"
#include "platform/fake/FakePreferenceService.h"
#include "platform/fake/FakePrivacyService.h"
#include "platform/fake/FakeProcessService.h"
#include "platform/fake/FakePropertyListService.h"
#include "platform/fake/FakeResultsFileService.h"
#include "platform/fake/FakeStatisticsService.h"
#include "platform/fake/FakeTlmReportingService.h"
#include "platform/fake/Journal.h"
#include "platform/services.h"

namespace halvox::platform {

// One fake of each platform service, installed while it exists. A test fixture has it as its first
// member, so that it outlives the code under test. Only one may exist at a time.
struct FakePlatform {
  FakePlatform();
  FakePlatform(const FakePlatform&) = delete;
  FakePlatform& operator=(const FakePlatform&) = delete;
  // Drops connections and pending jobs while all services still exist, because the destructors of
  // what they hold may call the services.
  ~FakePlatform();

  // The fakes with another analytics service, for a test that installs its own.
  [[nodiscard]] Services servicesWith(AnalyticsService& otherAnalytics);

  Journal journal;
  FakeClockService clock;
  FakeLogService log{journal};
  FakeStatisticsService statistics;
  FakeKdebugService kdebug{journal};
  FakeProcessService process{journal};
  FakeDevicePropertyService deviceProperties;
  FakeFeatureFlagService featureFlags;
  FakeAnalyticsService analytics{journal};
  FakeDiagnosticReporterService diagnosticReporters{journal};
  FakeFileService files{journal};
  FakeMetricService metrics{journal};
  FakeNotifyService notify;
  FakeOverflowService overflow;
  FakePowerLogService powerLog{journal};
  FakePreferenceService preferences;
  FakePrivacyService privacy;
  FakeIOReportService ioReport{journal};
  FakeKtraceService ktrace{journal};
  FakePerformanceTraceService performanceTraces{journal, dispatch};
  FakePropertyListService propertyLists;
  FakeResultsFileService resultsFiles{journal};
  FakeDispatchService dispatch{clock};
  FakeTlmReportingService tlmReporting{journal, dispatch};
  FakeConnectionService connections{journal};
};

}  // namespace halvox::platform
