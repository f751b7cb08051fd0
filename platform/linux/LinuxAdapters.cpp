#include "platform/linux/LinuxAdapters.h"

#include <filesystem>
#include <string>
#include <utility>
#include <vector>

#include "platform/linux/configuration/ConfigurationEnvironment.h"
#include "platform/linux/drivers/ConfiguredSources.h"
#include "platform/linux/drivers/DriverSourceLog.h"
#include "platform/linux/store/StoreErase.h"
#include "platform/linux/store/StoreVacuum.h"

namespace halvox::platform::linux_ {
namespace {

ConnectionOptions connectionOptions(const Configuration& configuration) {
  ConnectionOptions options;
  options.socket = configuration.listener.socket;
  options.socketAccess = {configuration.listener.mode, configuration.listener.group};
  // Make only the directory of the default socket, because after a fresh login it may not exist.
  // The administrator makes the directory of a configured path.
  options.makeSocketDirectory = configuration.listener.socket == defaultSocketPath();
  options.bus = configuration.listener.bus;
  options.starter = starterBus();
  options.handshakeTimeout = configuration.listener.handshakeTimeout;
  options.messageTimeout = configuration.listener.messageTimeout;
  options.clientHistoryMegabytes = configuration.limits.clientHistoryMegabytes;
  options.clientSessions = configuration.limits.clientSessions;
  options.messageReporterIDs = configuration.limits.messageReporterIDs;
  return options;
}

Dictionary readCounters(const CounterStatisticsService& statistics) {
  const std::vector<CounterReading> readings = statistics.snapshot();
  Dictionary counters;
  counters.reserve(readings.size());
  for (const CounterReading& reading : readings) {
    counters.add(reading.piece + ", " + reading.name, reading.value);
  }
  return counters;
}

std::string beginErase(SqliteStore& store, const Dictionary& options) {
  EraseRequest request;
  for (const auto& [name, value] : options) {
    if (name.text() == "app" && !value.string().empty()) {
      request.application = value.string();
    } else if (name.text() == "session" && value.isNumber() && value.toInt64() != 0) {
      request.session = value.toInt64();
    } else if (name.text() == "before" && value.isNumber()) {
      request.before = value.toDouble();
    } else {
      return "expected one of the options \"app\" with a name, \"session\" with a number other "
             "than 0, and \"before\" with a time, found \"" +
             std::string(name.text()) + '"';
    }
  }
  if (options.size() != 1) {
    return "expected one of the options \"app\", \"session\" and \"before\", found " +
           std::to_string(options.size());
  }
  return store.beginErase(request) ? "" : "an erasure runs already; wait until it ends";
}

// Runs on the I/O thread; the store outlives it.
StorageControl storageControl(SqliteStore& store) {
  const auto begin = [&store](const Dictionary& options) -> std::string {
    VacuumRequest request;
    for (const auto& [name, value] : options) {
      if (name.text() == "before" && value.isNumber()) {
        request.before = value.toDouble();
      } else if (name.text() == "to" && value.isNumber()) {
        request.toBytes = value.toUInt64();
      } else {
        return "expected the options \"before\" and \"to\" with numbers, found \"" +
               std::string(name.text()) + '"';
      }
    }
    if (request.toBytes.value_or(kLeastVacuumBytes) < kLeastVacuumBytes) {
      return "\"to\" must be at least " + std::to_string(kLeastVacuumBytes);
    }
    return store.beginVacuum(request) ? "" : "a vacuum runs already; wait until it ends";
  };
  return {.beginVacuum = begin,
          .vacuumState = [&store] { return describe(store.vacuumState()); },
          .beginErase = [&store](const Dictionary& options) { return beginErase(store, options); },
          .eraseState = [&store] { return describe(store.eraseState()); }};
}

StoreOptions storeOptions(const Configuration& configuration) {
  StoreOptions options;
  options.directory = configuration.storage.directory;
  options.root = configuration.storage.root;
  options.retentionDays = configuration.storage.retentionDays;
  options.maxMegabytes = configuration.storage.maxMegabytes;
  options.wantedEvents = configuration.analytics.wanted;
  return options;
}

SnapshotOptions snapshotOptions(const Configuration& configuration) {
  SnapshotOptions options;
  options.storageDirectory = configuration.storage.directory;
  options.keep = configuration.keepSnapshots;
  return options;
}

bool isTracingEnabled(FeatureFlagService& features) {
  return features._os_feature_enabled_impl("Acoustat", "Tracing");
}

// If trace points are not available, the service runs without them and logs the reason at the
// start. LTTng maps the buffers of every recording session into each process that has loaded LTTng.
// The service therefore loads it only if the configuration asks for trace points.
TracePoints makeTracePoints(const Configuration& configuration, FeatureFlagService& features) {
  if (!configuration.tracePoints && !isTracingEnabled(features)) {
    return {std::make_unique<NoKdebugService>(), "none, diagnostics.trace_points is not true"};
  }
  auto loaded = LttngKdebugService::load();
  if (loaded) return {*std::move(loaded), "LTTng"};
  return {std::make_unique<NoKdebugService>(), "none, " + loaded.error().message};
}

TraceOptions traceOptions(const Configuration& configuration, FeatureFlagService& features) {
  const bool isEnabled = isTracingEnabled(features);
  return {.storageDirectory = configuration.storage.directory,
          .tracing = isEnabled ? Tracing::kEnabled : Tracing::kDisabled};
}

// Null if link.backend is not "nats", an error if its module cannot be loaded.
Result<std::unique_ptr<NatsTlmReporting>> makeNats(const Configuration::Link& options,
                                                   const NatsEnvironment& environment) {
  if (options.backend != LinkBackend::kNats) return nullptr;
  return loadNatsTlmReporting(options, environment);
}

}  // namespace

LinuxAdapters::LinuxAdapters(const Configuration& settings, std::function<void()> onReportSignal)
    : configuration(settings),
      connections(
          [this, &onReportSignal] {
            ConnectionOptions options = connectionOptions(configuration);
            options.beginBatch = [this] {
              dispatch.holdPool();
              dispatch.beginHelping();
            };
            options.endBatch = [this] { dispatch.endHelping(); };
            // Wake the pool only after the replies were written, because a client should not wait
            // while other threads are woken.
            options.afterReplies = [this] { dispatch.wakePool(); };
            options.onReportSignal = std::move(onReportSignal);
            options.hasProgressed = [this] { return dispatch.hasProgressed(watchedQueue); };
            options.storage = storageControl(store);
            options.counters = [this] { return readCounters(statistics); };
            return options;
          }(),
          backpressure),
      featureFlags(configuration.features),
      tracePoints(makeTracePoints(configuration, featureFlags)),
      log(QueuedLogService::onStandardError({configuration.logLevel, configuration.logMemoryLevel},
                                            statistics)),
      // Write the queued lines of the log, because the last one says why the process ends.
      process([this] { log->stop(); }),
      deviceProperties(configuration.device),
      privacy(configuration.privacy),
      store(storeOptions(configuration), {clock, statistics, backpressure}),
      analytics(store, clock),
      diagnosticReporters(snapshotOptions(configuration),
                          {.log = *log,
                           .statistics = statistics,
                           .keptLines = [this] { return log->keptLines(); },
                           .recorder = &snapshotRecorder}),
      files(configuration.storage.root, statistics),
      overflow({.directory = configuration.storage.directory,
                .clientMegabytes = configuration.limits.clientHistoryMegabytes},
               statistics),
      preferenceReader(configuration.preferencesDirectory, *log),
      notify(configuration.notifyDirectory, preferenceReader, *log, statistics),
      preferences(preferenceReader, statistics),
      ioReport(makeDriverSources(configuration.drivers, driversCategory(*log)),
               driversCategory(*log), statistics),
      resultsFiles(configuration.storage.root, *log, statistics),
      traces(makeTraceServices(traceOptions(configuration, featureFlags), *log, statistics)),
      dispatch(*log, statistics),
      nats(makeNats(configuration.link,
                    {.dispatch = dispatch,
                     .statistics = statistics,
                     .spool = configuration.link.spool ? &linkSpool : nullptr})) {}

TLMReportingService& LinuxAdapters::realTimeLink() {
  if (nats && *nats) return **nats;
  if (configuration.link.backend == LinkBackend::kNone) return noLink;
  return localLink;
}

}  // namespace halvox::platform::linux_
