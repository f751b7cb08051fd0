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
class PerformanceTraceService;
class PowerLogService;
class PreferenceService;
class ProcessService;
class PropertyListService;
class ResultsFileService;
class StatisticsService;
class TLMReportingService;

// The platform services that the system asks for everything outside itself. Whoever makes the set
// owns the services and keeps them until no other thread runs any more.
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
  PerformanceTraceService& performanceTraces;
  PowerLogService& powerLog;
  PreferenceService& preferences;
  ProcessService& process;
  PropertyListService& propertyLists;
  ResultsFileService& resultsFiles;
  StatisticsService& statistics;
  TLMReportingService& tlmReporting;
};

// Installs the services: once, before anything else, on the only thread. Tests install a new set
// for each test while no other thread of theirs runs.
void installServices(const Services& services);

// The installed services. Calling one before the installation ends the process.
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
PerformanceTraceService& performanceTraces();
PowerLogService& powerLog();
PreferenceService& preferences();
ProcessService& process();
PropertyListService& propertyLists();
ResultsFileService& resultsFiles();
StatisticsService& statistics();
TLMReportingService& tlmReporting();

}  // namespace halvox::platform
