#include "platform/linux/LinuxPlatform.h"

#include <utility>
#include <variant>

#include <sysexits.h>

#include "platform/linux/configuration/ConfigurationEnvironment.h"
#include "platform/linux/drivers/ConfiguredSources.h"
#include "platform/log.h"

namespace halvox::platform::linux_ {
namespace {

// How long the end of the service waits for jobs that run.
constexpr std::chrono::seconds kJobsEndWithin{5};
// How long it lets the queues of sessions run what they have before that.
constexpr std::chrono::seconds kQueuesFinishWithin{5};

LogCategory& mainCategory() {
  static LogCategory& category = platform::log().createCategory("com.tarno.halvox", "main");
  return category;
}

constexpr UnitLog kLog(mainCategory, "LinuxPlatform");

ConnectionOptions connectionOptions(const Configuration& configuration) {
  ConnectionOptions options;
  options.socket = configuration.listener.socket;
  options.socketAccess = {configuration.listener.mode, configuration.listener.group};
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

StoreOptions storeOptions(const Configuration& configuration) {
  StoreOptions options;
  options.directory = configuration.storage.directory;
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

std::unique_ptr<KdebugService> makeKdebug(std::string& failure) {
  const std::filesystem::path module = LttngKdebugService::modulePath();
  if (module.empty()) {
    failure = "not in this build";
    return std::make_unique<NoKdebugService>();
  }
  auto loaded = LttngKdebugService::load(module);
  if (auto* service = std::get_if<std::unique_ptr<KdebugService>>(&loaded)) {
    return std::move(*service);
  }
  failure = std::get<std::string>(loaded);
  return std::make_unique<NoKdebugService>();
}

int exitStatus(StoreError::Kind kind) {
  switch (kind) {
    case StoreError::Kind::kDirectory:
      return EX_CANTCREAT;
    case StoreError::Kind::kInUse:
      return EX_UNAVAILABLE;
    case StoreError::Kind::kNewerVersion:
      return EX_DATAERR;
    case StoreError::Kind::kMissing:
    case StoreError::Kind::kDamaged:
    case StoreError::Kind::kCannotOpen:
      return EX_IOERR;
  }
  return EX_SOFTWARE;
}

int exitStatus(ConnectionOpenError::Kind kind) {
  switch (kind) {
    case ConnectionOpenError::Kind::kPathTooLong:
    case ConnectionOpenError::Kind::kUnknownGroup:
      return EX_CONFIG;
    case ConnectionOpenError::Kind::kNotPermitted:
      return EX_NOPERM;
    case ConnectionOpenError::Kind::kDirectoryMissing:
    case ConnectionOpenError::Kind::kDirectoryNotWritable:
    case ConnectionOpenError::Kind::kNotASocket:
      return EX_CANTCREAT;
    case ConnectionOpenError::Kind::kAlreadyServed:
    case ConnectionOpenError::Kind::kBusUnreachable:
    case ConnectionOpenError::Kind::kBusNameTaken:
      return EX_UNAVAILABLE;
    case ConnectionOpenError::Kind::kBadActivation:
      return EX_USAGE;
    case ConnectionOpenError::Kind::kSystem:
      return EX_OSERR;
  }
  return EX_SOFTWARE;
}

const char* linkName(LinkBackend backend) {
  switch (backend) {
    case LinkBackend::kLocal:
      return "local";
    case LinkBackend::kNats:
      return "nats";
    case LinkBackend::kNone:
      return "none";
  }
  return "";
}

const char* busName(BusKind kind) {
  switch (kind) {
    case BusKind::kNone:
      return "none";
    case BusKind::kSession:
      return "session";
    case BusKind::kSystem:
      return "system";
  }
  return "";
}

}  // namespace

LinuxPlatform::LinuxPlatform(const Configuration& configuration)
    : configuration_(configuration),
      connections_(
          [this] {
            ConnectionOptions options = connectionOptions(configuration_);
            options.beginBatch = [this] {
              dispatch_.holdPool();
              dispatch_.beginHelping();
            };
            options.endBatch = [this] { dispatch_.endHelping(); };
            // A client's answer should not wait until other threads are woken.
            options.afterReplies = [this] { dispatch_.wakePool(); };
            options.onReportSignal = [this] { logStatistics(LogLevel::kDefault, Counters::kAll); };
            return options;
          }(),
          backpressure_),
      kdebug_(makeKdebug(kdebugFailure_)),
      log_(SpdlogLogService::onStandardError(
          {configuration_.logLevel, configuration_.logMemoryLevel}, statistics_)),
      // Its last line tells why the process ended.
      process_([this] { log_->stop(); }),
      deviceProperties_(configuration_.device),
      featureFlags_(configuration_.features),
      store_(storeOptions(configuration_), {clock_, statistics_, backpressure_}),
      analytics_(store_, clock_),
      diagnosticReporters_(snapshotOptions(configuration_),
                           {.statistics = statistics_,
                            .log = [this] { return log_->keptLines(); },
                            .recorder = &snapshotRecorder_}),
      files_(configuration_.storage.root, statistics_),
      preferenceReader_(configuration_.preferencesDirectory),
      notify_(configuration_.notifyDirectory, preferenceReader_, statistics_),
      preferences_(preferenceReader_, statistics_),
      ioReport_(makeDriverSources(configuration_.drivers), statistics_),
      resultsFiles_(configuration_.storage.root, statistics_),
      traces_(makeTraceServices(configuration_.storage.directory, statistics_)),
      dispatch_(*log_, statistics_),
      nats_(configuration_.link.backend == LinkBackend::kNats
                ? makeNatsTlmReporting(configuration_.link, {dispatch_, statistics_})
                : nullptr) {}

TLMReportingService& LinuxPlatform::realTimeLink() {
  if (nats_) return *nats_;
  if (configuration_.link.backend == LinkBackend::kNone) return noLink_;
  return localLink_;
}

Services LinuxPlatform::services() {
  return {.analytics = analytics_,
          .clock = clock_,
          .connections = connections_,
          .deviceProperties = deviceProperties_,
          .diagnosticReporters = diagnosticReporters_,
          .dispatch = dispatch_,
          .featureFlags = featureFlags_,
          .files = files_,
          .ioReport = ioReport_,
          .kdebug = *kdebug_,
          .ktrace = traces_->ktrace(),
          .log = *log_,
          .metrics = metrics_,
          .notify = notify_,
          .performanceTraces = traces_->performanceTraces(),
          .powerLog = powerLog_,
          .preferences = preferences_,
          .process = process_,
          .propertyLists = propertyLists_,
          .resultsFiles = resultsFiles_,
          .statistics = statistics_,
          .tlmReporting = realTimeLink()};
}

std::optional<StartFailure> LinuxPlatform::open() {
  if (configuration_.link.backend == LinkBackend::kNats && !nats_) {
    return StartFailure{EX_CONFIG, "link.backend is \"nats\", which is not in this build"};
  }
  if (const auto error = store_.open()) {
    return StartFailure{exitStatus(error->kind), error->description};
  }
  diagnosticReporters_.removeLeftovers();
  traces_->open();
  ioReport_.open();
  if (const auto error = connections_.open()) {
    return StartFailure{exitStatus(error->kind), error->description};
  }
  logStart();
  return std::nullopt;
}

bool LinuxPlatform::close() {
  diagnosticReporters_.stop();
  notify_.stop();  // it adds jobs to queues
  traces_->stop();
  // What sessions were sent is to reach the link; its queues give way to all else, so they may be
  // behind.
  dispatch_.finish(kQueuesFinishWithin);
  const bool ended = dispatch_.stop(kJobsEndWithin);
  ended ? traces_->close() : traces_->abandon();
  linkCallbacks_.stop();
  const bool linkEnded = !nats_ || nats_->close();
  store_.close();
  logStatistics(LogLevel::kInfo, Counters::kCounted);
  log_->stop();
  return ended && linkEnded;
}

void LinuxPlatform::logStart() const {
  kLog.notice("serving ", configuration_.listener.socket.string(), ", bus ",
              busName(configuration_.listener.bus), ", store ",
              configuration_.storage.directory.string());
  kLog.notice("link: ", linkName(configuration_.link.backend), ", in this build: local, ",
              isNatsBuilt() ? "nats, " : "", "none");
  kLog.notice("trace points: ", kdebugFailure_.empty() ? "LTTng" : "none, LTTng " + kdebugFailure_);
  kLog.notice("traces: ", traces_->description());
}

void LinuxPlatform::logStatistics(LogLevel level, Counters counters) const {
  for (const CounterReading& reading : statistics_.snapshot()) {
    if (reading.value == 0 && counters == Counters::kCounted) continue;
    UnitLog::logTo(mainCategory(), "LinuxPlatform", level, "counted ", reading.piece, ", ",
                   reading.name, ": ", reading.value);
  }
}

}  // namespace halvox::platform::linux_
