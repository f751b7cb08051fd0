#include "platform/linux/LinuxPlatform.h"

#include <chrono>
#include <string>
#include <utility>

#include <malloc.h>
#include <sysexits.h>

#include "platform/linux/LinuxAdapters.h"
#include "platform/linux/StartFailure.h"
#include "platform/linux/configuration/LinkBackendName.h"
#include "platform/linux/drivers/ConfiguredSources.h"

namespace halvox::platform::linux_ {
namespace {

// How long the end of the service waits for running jobs to end.
constexpr std::chrono::seconds kJobsEndWithin{5};
// Before that, the end of the service waits for all queues to run their pending jobs: the requests
// that were read, the summary files, and the queues of sessions. The summary of a session of a
// million messages takes about a second. Several of them are made one after the other. systemd
// kills a service that takes longer than 90 seconds to end.
constexpr AsioDispatchService::FinishLimits kQueuesFinish{
    .withoutProgress = std::chrono::seconds(5), .total = std::chrono::seconds(30)};

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

// malloc() makes a mapping of its own for each block of at least this size, which free() returns to
// the system. Without a fixed value, glibc raises the limit to the largest block that was ever
// freed. The summaries of one long session would then stay in the heap until the process ends.
constexpr int kMappedBytes = 256 * 1024;
// How much free memory the heap may keep at its end. A busy service constantly allocates and frees
// less than this, which then needs no system calls.
constexpr int kKeptBytes = 2 * 1024 * 1024;

void limitFreeMemory() {
  ::mallopt(M_MMAP_THRESHOLD, kMappedBytes);
  ::mallopt(M_TRIM_THRESHOLD, kKeptBytes);
}

}  // namespace

LinuxPlatform::LinuxPlatform(const Configuration& configuration)
    : adapters_(std::make_unique<LinuxAdapters>(
          configuration, [this] { logStatistics(LogLevel::kDefault, Counters::kAll); })),
      log_(adapters_->log->createCategory("com.tarno.halvox", "main"), "LinuxPlatform") {
  limitFreeMemory();
}

LinuxPlatform::~LinuxPlatform() = default;

Services LinuxPlatform::services() {
  return {.analytics = adapters_->analytics,
          .clock = adapters_->clock,
          .connections = adapters_->connections,
          .deviceProperties = adapters_->deviceProperties,
          .diagnosticReporters = adapters_->diagnosticReporters,
          .dispatch = adapters_->dispatch,
          .featureFlags = adapters_->featureFlags,
          .files = adapters_->files,
          .ioReport = adapters_->ioReport,
          .kdebug = *adapters_->tracePoints.service,
          .ktrace = adapters_->traces->ktrace(),
          .log = *adapters_->log,
          .metrics = adapters_->metrics,
          .notify = adapters_->notify,
          .overflow = adapters_->overflow,
          .performanceTraces = adapters_->traces->performanceTraces(),
          .powerLog = adapters_->powerLog,
          .preferences = adapters_->preferences,
          .privacy = adapters_->privacy,
          .process = adapters_->process,
          .propertyLists = adapters_->propertyLists,
          .resultsFiles = adapters_->resultsFiles,
          .statistics = adapters_->statistics,
          .tlmReporting = adapters_->realTimeLink()};
}

void LinuxPlatform::watchQueue(std::string label) { adapters_->watchedQueue = std::move(label); }

Result<void, int> LinuxPlatform::open() {
  if (const auto& nats = adapters_->nats; !nats) {
    return Failure<int>{EX_CONFIG, "link.backend = \"nats\" needs " + nats.error().message};
  }
  // Open the store before the sockets, so that everything that is accepted can be stored.
  if (const auto opened = adapters_->store.open(); !opened) return startFailure(opened.error());
  if (const auto& nats = adapters_->nats; *nats) (*nats)->resume();
  // Remove leftovers only after opening the store. Its lock shows that no other service uses the
  // directory, and therefore none uses these files.
  adapters_->diagnosticReporters.removeLeftovers();
  adapters_->traces->open();
  adapters_->ioReport.open();
  if (const auto opened = adapters_->connections.open(); !opened) {
    return startFailure(opened.error());
  }
  logStart();
  return {};
}

bool LinuxPlatform::close() {
  // First stop what adds jobs to the queues. Captures add jobs for their replies. Requests that are
  // carried out below may still ask for a capture: it is refused, counted and answered.
  adapters_->diagnosticReporters.stop();
  adapters_->notify.stop();  // adds the jobs of handlers
  // Stop traces before the queues, because a stop of a session may wait for a trace that is still
  // being read. The end of the service would otherwise take as long as reading its traces, whose
  // results may therefore be incomplete.
  adapters_->traces->stop();
  // A message that was answered without an error must reach the link. The queue of its session may
  // still hold it, because these queues have a lower priority than requests. A stop that has begun
  // must report its run: its file, its event and the requests that wait for it move between a
  // shared queue and the reporting queue.
  if (const std::uint64_t jobs = adapters_->dispatch.finish(kQueuesFinish); jobs > 0) {
    log_.error("the queues have not finished in time; discarding ", jobs,
               " jobs: their requests, messages and summaries are lost");
  }
  const bool ended = adapters_->dispatch.stop(kJobsEndWithin);
  ended ? adapters_->traces->close() : adapters_->traces->abandon();
  // Stop the callbacks after the queues, when no session can request a callback any more.
  adapters_->linkCallbacks.stop();
  const auto& nats = adapters_->nats;
  const bool linkEnded = !nats || !*nats || (*nats)->close();
  // Close the store after the link, because the local link writes messages to it until the link has
  // ended, and the link to NATS leaves there what it could not send.
  adapters_->store.close();
  // Log the counters after everything that counts has ended, because their sums agree only then.
  logStatistics(LogLevel::kInfo, Counters::kCounted);
  // Stop the log last, because everything above may log.
  adapters_->log->stop();
  return ended && linkEnded;
}

void LinuxPlatform::logStatistics(LogLevel level, Counters counters) const {
  for (const CounterReading& reading : adapters_->statistics.snapshot()) {
    if (reading.value == 0 && counters == Counters::kCounted) continue;
    log_.log(level, "counted ", reading.piece, ", ", reading.name, ": ", reading.value);
  }
}

void LinuxPlatform::logStart() const {
  log_.notice("serving ", adapters_->configuration.listener.socket.string(), ", bus ",
              busName(adapters_->configuration.listener.bus), ", store ",
              adapters_->configuration.storage.directory.string());
  log_.notice("link: ", linkBackendName(adapters_->configuration.link.backend));
  log_.notice("trace points: ", adapters_->tracePoints.description);
  log_.notice("traces: ", adapters_->traces->description());
  if (adapters_->configuration.drivers.alsa && !hasAlsaSource()) {
    log_.notice("drivers.alsa = true needs HALVOX_ALSA, which this build does not have; ALSA's ",
                "counters are not reported");
  }
}

}  // namespace halvox::platform::linux_
