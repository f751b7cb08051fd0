#pragma once

#include <functional>
#include <memory>
#include <string>

#include "platform/linux/SqliteSnapshotRecorder.h"
#include "platform/linux/base/Result.h"
#include "platform/linux/configuration/Configuration.h"
#include "platform/linux/configuration/ConfiguredDevicePropertyService.h"
#include "platform/linux/configuration/ConfiguredFeatureFlagService.h"
#include "platform/linux/configuration/ConfiguredPrivacyService.h"
#include "platform/linux/connection/LinuxConnectionService.h"
#include "platform/linux/diagnostics/SnapshotDiagnosticReporterService.h"
#include "platform/linux/dispatch/AsioDispatchService.h"
#include "platform/linux/dispatch/Backpressure.h"
#include "platform/linux/drivers/LinuxIOReportService.h"
#include "platform/linux/files/FileOverflowService.h"
#include "platform/linux/files/RootedFileService.h"
#include "platform/linux/kdebug/LttngKdebugService.h"
#include "platform/linux/link/local/CallbackThread.h"
#include "platform/linux/link/local/LocalTlmReportingService.h"
#include "platform/linux/link/local/NoneTlmReportingService.h"
#include "platform/linux/link/nats/NatsModule.h"
#include "platform/linux/log/QueuedLogService.h"
#include "platform/linux/runtime/CounterStatisticsService.h"
#include "platform/linux/runtime/LibcClockService.h"
#include "platform/linux/runtime/ProcfsProcessService.h"
#include "platform/linux/settings/InotifyNotifyService.h"
#include "platform/linux/settings/PreferenceReader.h"
#include "platform/linux/settings/TomlPreferenceService.h"
#include "platform/linux/store/SqliteAnalyticsService.h"
#include "platform/linux/store/SqliteMetricService.h"
#include "platform/linux/store/SqlitePowerLogService.h"
#include "platform/linux/store/SqliteStore.h"
#include "platform/linux/store/spool/SqliteLinkSpool.h"
#include "platform/linux/tracing/JsonResultsFileService.h"
#include "platform/linux/tracing/PlistPropertyListService.h"
#include "platform/linux/tracing/TraceServices.h"

namespace halvox::platform::linux_ {

struct TracePoints {
  std::unique_ptr<KdebugService> service;
  std::string description;  // for the log: "LTTng", or "none, " and why
};

// Every adapter of one process, in the order in which they need each other. Belongs to
// LinuxPlatform, which opens and closes them. It has a header of its own, which only the two
// sources that compose the service include, because the header has many includes.
struct LinuxAdapters {
  // Starts the threads of the log and of the queues; nothing outside the process is touched yet.
  // `onReportSignal` runs on the main thread for each SIGUSR1.
  LinuxAdapters(const Configuration& settings, std::function<void()> onReportSignal);
  LinuxAdapters(const LinuxAdapters&) = delete;
  LinuxAdapters& operator=(const LinuxAdapters&) = delete;

  // The adapter of the back-end that the configuration names.
  [[nodiscard]] TLMReportingService& realTimeLink();

  // The connections are made before everything that has threads, because they block the signals
  // that end the process, and every thread that starts later inherits this.
  const Configuration configuration;
  std::string watchedQueue;  // see LinuxPlatform::watchQueue()
  CounterStatisticsService statistics;
  Backpressure backpressure;
  LinuxConnectionService connections;
  ConfiguredFeatureFlagService featureFlags;
  TracePoints tracePoints;
  std::unique_ptr<QueuedLogService> log;
  LibcClockService clock;
  ProcfsProcessService process;
  ConfiguredDevicePropertyService deviceProperties;
  ConfiguredPrivacyService privacy;
  SqliteStore store;
  SqliteAnalyticsService analytics;
  SqliteSnapshotRecorder snapshotRecorder{store};
  SqliteLinkSpool linkSpool{store};
  SnapshotDiagnosticReporterService diagnosticReporters;
  RootedFileService files;
  FileOverflowService overflow;
  SqliteMetricService metrics{store, clock};
  PreferenceReader preferenceReader;
  InotifyNotifyService notify;
  SqlitePowerLogService powerLog{store, clock};
  TomlPreferenceService preferences;
  // Uses the queues, which are destroyed first because they are members below.
  // LinuxPlatform::close() therefore ends this thread while the queues still exist.
  CallbackThread linkCallbacks{dispatch};
  LocalTlmReportingService localLink{store, clock, linkCallbacks};
  NoneTlmReportingService noLink{statistics, linkCallbacks};
  LinuxIOReportService ioReport;
  PlistPropertyListService propertyLists;
  JsonResultsFileService resultsFiles;
  const std::unique_ptr<TraceServices> traces;
  AsioDispatchService dispatch;
  // Null unless link.backend is "nats"; then an error if its module cannot be loaded.
  const Result<std::unique_ptr<NatsTlmReporting>> nats;
};

}  // namespace halvox::platform::linux_
