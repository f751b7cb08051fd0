#pragma once

namespace halvox::platform {

class AnalyticsService;
class ClockService;
class ConnectionService;
class DevicePropertyService;
class DispatchService;
class FeatureFlagService;
class KdebugService;
class LogService;
class ProcessService;
class StatisticsService;

// The platform services that the system asks for everything outside itself. Whoever makes the set
// owns the services and keeps them until no other thread runs any more.
struct Services {
  AnalyticsService& analytics;
  ClockService& clock;
  ConnectionService& connections;
  DevicePropertyService& deviceProperties;
  DispatchService& dispatch;
  FeatureFlagService& featureFlags;
  KdebugService& kdebug;
  LogService& log;
  ProcessService& process;
  StatisticsService& statistics;
};

// Installs the services: once, before anything else, on the only thread. Tests install a new set
// for each test while no other thread of theirs runs.
void installServices(const Services& services);

// The installed services. Calling one before the installation ends the process.
AnalyticsService& analytics();
ClockService& clock();
ConnectionService& connections();
DevicePropertyService& deviceProperties();
DispatchService& dispatch();
FeatureFlagService& featureFlags();
KdebugService& kdebug();
LogService& log();
ProcessService& process();
StatisticsService& statistics();

}  // namespace halvox::platform
