#pragma once

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>

#include "platform/diagnostic_reporter.h"
#include "platform/linux/configuration/Defaults.h"
#include "platform/linux/diagnostics/SnapshotRecorder.h"
#include "platform/linux/diagnostics/SystemFacts.h"
#include "platform/linux/log/LogMemory.h"
#include "platform/log.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

struct SnapshotOptions {
  std::filesystem::path storageDirectory;
  std::uint32_t keep = defaults::kKeptSnapshots;  // the number of newest snapshots to keep
  std::uint64_t mostBytes = 64U << 20U;           // the size of one, before compression
  // After this time, the service stops collecting and writes the snapshot.
  std::chrono::milliseconds collectWithin{8000};
  std::chrono::milliseconds stateWithin{2000};  // for the service's state
  std::chrono::milliseconds dumpWithin{3000};   // for the dump of PipeWire
  SystemPaths paths{};
};

// The objects that a snapshot needs. All must outlive the service.
struct SnapshotPartners {
  LogService& log;
  StatisticsService& statistics;
  std::function<LogMemory::Contents()> keptLines{};  // empty: no log is kept in memory
  SnapshotRecorder* recorder = nullptr;              // null: no records are kept
};

// Captures diagnostics into archives in the directory `snapshots` of the storage directory:
//
//   20260301T120000Z-haptics-Session_Generic.tar.zst
//
// Takes one snapshot at a time, on a thread of its own with low priority. The thread starts with
// the first request and sleeps between requests. A request that comes while another is being
// carried out is refused, and so is every request after stop(). Each request is answered with
// {"path", "size_bytes", "seconds"} or {"error"}, never before the call has returned.
//
// When a snapshot fails, no file remains and an error is logged, at most one a second. The next
// request tries again.
//
// Owned by the platform. Any thread may use it. Reporters may outlive the service.
class SnapshotDiagnosticReporterService final : public DiagnosticReporterService {
 public:
  SnapshotDiagnosticReporterService(SnapshotOptions options, SnapshotPartners partners);
  ~SnapshotDiagnosticReporterService() override;

  [[nodiscard]] std::shared_ptr<AILDiagnosticReporter> createReporter() override;
  // The service calls the source on the thread that takes snapshots, once for each snapshot, until
  // stop().
  void setStateSource(StateSource source) override;

  // Deletes the unfinished snapshot of a service that was killed. Call it before the first request,
  // after the lock on the storage directory was taken.
  void removeLeftovers() const;
  // Aborts the current snapshot, which is answered with an error and leaves no file, and ends the
  // thread. Blocks until then. Idempotent. Must not be called from a reply, because the thread
  // would wait for itself.
  void stop();

 private:
  class Worker;
  class Reporter;

  const std::shared_ptr<Worker> worker_;
};

}  // namespace halvox::platform::linux_
