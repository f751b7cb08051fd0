#pragma once

namespace halvox::platform {

class AnalyticsService;
class ClockService;
class ConnectionService;
class DevicePropertyService;
class DiagnosticReporterService;
class DispatchService;
class FeatureFlagService;
class FileService;
class IOReportService;
class KdebugService;
class KtraceService;
class LogService;
class MetricService;
class NotifyService;
class OverflowService;
class PerformanceTraceService;
class PowerLogService;
class PreferenceService;
class PrivacyService;
class ProcessService;
class PropertyListService;
class ResultsFileService;
class StatisticsService;
class TLMReportingService;

// The platform services: everything that the system asks of the platform that it runs on.
//
// The composition root (service/main.cpp, or the FakePlatform of a test) makes the services, owns
// them, and destroys them after all other threads have ended. This struct only refers to them.
struct Services {
  AnalyticsService& analytics;
  ClockService& clock;
  ConnectionService& connections;
  DevicePropertyService& deviceProperties;
  DiagnosticReporterService& diagnosticReporters;
  DispatchService& dispatch;
  FeatureFlagService& featureFlags;
  FileService& files;
  IOReportService& ioReport;
  KdebugService& kdebug;
  KtraceService& ktrace;
  LogService& log;
  MetricService& metrics;
  NotifyService& notify;
  OverflowService& overflow;
  PerformanceTraceService& performanceTraces;
  PowerLogService& powerLog;
  PreferenceService& preferences;
  PrivacyService& privacy;
  ProcessService& process;
  PropertyListService& propertyLists;
  ResultsFileService& resultsFiles;
  StatisticsService& statistics;
  TLMReportingService& tlmReporting;
};

// Installs the services. Call it once, before anything else, while there is only one thread. Tests
// install a new set for each test, while none of their other threads runs. There is no lock,
// because the functions below are called for every message.
void installServices(const Services& services);

// The installed services. Any thread may call them after installServices(). An earlier call is a
// bug in the program. It prints a line and aborts the process.
AnalyticsService& analytics();
ClockService& clock();
ConnectionService& connections();
DevicePropertyService& deviceProperties();
DiagnosticReporterService& diagnosticReporters();
DispatchService& dispatch();
FeatureFlagService& featureFlags();
FileService& files();
IOReportService& ioReport();
KdebugService& kdebug();
KtraceService& ktrace();
LogService& log();
MetricService& metrics();
NotifyService& notify();
OverflowService& overflow();
PerformanceTraceService& performanceTraces();
PowerLogService& powerLog();
PreferenceService& preferences();
PrivacyService& privacy();
ProcessService& process();
PropertyListService& propertyLists();
ResultsFileService& resultsFiles();
StatisticsService& statistics();
TLMReportingService& tlmReporting();

}  // namespace halvox::platform
