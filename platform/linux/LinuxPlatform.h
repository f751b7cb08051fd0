#pragma once

#include <memory>
#include <optional>
#include <string>

#include "platform/linux/SqliteSnapshotRecorder.h"
#include "platform/linux/configuration/Configuration.h"
#include "platform/linux/configuration/ConfiguredDevicePropertyService.h"
#include "platform/linux/configuration/ConfiguredFeatureFlagService.h"
#include "platform/linux/connection/LinuxConnectionService.h"
#include "platform/linux/diagnostics/SnapshotDiagnosticReporterService.h"
#include "platform/linux/dispatch/AsioDispatchService.h"
#include "platform/linux/dispatch/Backpressure.h"
#include "platform/linux/drivers/LinuxIOReportService.h"
#include "platform/linux/files/RootedFileService.h"
#include "platform/linux/kdebug/LttngKdebugService.h"
#include "platform/linux/link/local/CallbackThread.h"
#include "platform/linux/link/local/LocalTlmReportingService.h"
#include "platform/linux/link/local/NoneTlmReportingService.h"
#include "platform/linux/link/nats/NatsTlmReporting.h"
#include "platform/linux/log/SpdlogLogService.h"
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
#include "platform/linux/tracing/JsonResultsFileService.h"
#include "platform/linux/tracing/PlistPropertyListService.h"
#include "platform/linux/tracing/TraceServices.h"
#include "platform/services.h"

namespace halvox::platform::linux_ {

// Why the service cannot start: one line for the user, and the exit status that tells scripts
// which kind of reason it was (those of sysexits.h).
struct StartFailure {
  int exitStatus;
  std::string description;
};

// All Linux adapters of one process, made from its configuration. Belongs to the main thread.
//
//   made --open()--> serving --close()--> closed
class LinuxPlatform {
 public:
  // Starts the threads of the log and of the queues; nothing outside the process is touched yet.
  explicit LinuxPlatform(const Configuration& configuration);
  LinuxPlatform(const LinuxPlatform&) = delete;
  LinuxPlatform& operator=(const LinuxPlatform&) = delete;

  [[nodiscard]] Services services();
  // Opens the store, then the socket, so that nothing is accepted that could not be kept.
  // The services must be installed.
  [[nodiscard]] std::optional<StartFailure> open();
  // Ends the queues, writes what waits for the store, and tells the statistics in the log. False
  // when a job or the link would not end: the process must then end without destroying anything.
  [[nodiscard]] bool close();

 private:
  void logStart() const;
  // Those that counted anything, or all, at that level.
  enum class Counters : std::uint8_t { kCounted, kAll };
  void logStatistics(LogLevel level, Counters counters) const;
  TLMReportingService& realTimeLink();

  // In the order in which they need each other. The connections come before all that has threads,
  // because they take the end signals from every thread that starts after them.
  const Configuration configuration_;
  CounterStatisticsService statistics_;
  Backpressure backpressure_;
  LinuxConnectionService connections_;
  std::string kdebugFailure_;
  std::unique_ptr<KdebugService> kdebug_;
  std::unique_ptr<SpdlogLogService> log_;
  LibcClockService clock_;
  ProcfsProcessService process_;
  ConfiguredDevicePropertyService deviceProperties_;
  ConfiguredFeatureFlagService featureFlags_;
  SqliteStore store_;
  SqliteAnalyticsService analytics_;
  SqliteSnapshotRecorder snapshotRecorder_{store_};
  SnapshotDiagnosticReporterService diagnosticReporters_;
  RootedFileService files_;
  SqliteMetricService metrics_{store_, clock_};
  PreferenceReader preferenceReader_;
  InotifyNotifyService notify_;
  SqlitePowerLogService powerLog_{store_, clock_};
  TomlPreferenceService preferences_;
  // Uses the queues, which come later; close() ends it while they are still there.
  CallbackThread linkCallbacks_{dispatch_};
  LocalTlmReportingService localLink_{store_, clock_, linkCallbacks_};
  NoneTlmReportingService noLink_{statistics_, linkCallbacks_};
  LinuxIOReportService ioReport_;
  PlistPropertyListService propertyLists_;
  JsonResultsFileService resultsFiles_;
  const std::unique_ptr<TraceServices> traces_;
  AsioDispatchService dispatch_;
  const std::unique_ptr<NatsTlmReporting> nats_;  // only when the link goes there
};

}  // namespace halvox::platform::linux_
