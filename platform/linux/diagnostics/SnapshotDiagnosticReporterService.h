#pragma once

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <functional>
#include <memory>

#include "platform/diagnostic_reporter.h"
#include "platform/linux/diagnostics/SnapshotRecorder.h"
#include "platform/linux/diagnostics/SystemFacts.h"
#include "platform/linux/runtime/LogMemory.h"
#include "platform/statistics.h"

namespace halvox::platform::linux_ {

struct SnapshotOptions {
  std::filesystem::path storageDirectory;
  std::uint32_t keep = 20;               // so many of the newest snapshots
  std::uint64_t mostBytes = 64U << 20U;  // of one, before compression
  // After that nothing more is collected; what there is is written.
  std::chrono::milliseconds collectWithin{8000};
  std::chrono::milliseconds stateWithin{2000};
  std::chrono::milliseconds dumpWithin{3000};
  SystemPaths paths{};
};

// Who else takes part in a snapshot. All must outlive the service.
struct SnapshotPartners {
  StatisticsService& statistics;
  std::function<LogMemory::Contents()> log{};  // empty: there are no lines
  SnapshotRecorder* recorder = nullptr;        // null: nobody keeps records
};

// Captures diagnostics into archives in the directory `snapshots` of the storage directory:
//
//   20260301T120000Z-haptics-Session_Generic.tar.zst
//
// One snapshot at a time, on a thread of its own with a low priority, which begins with the first
// request and sleeps between them. A request that comes while one is in work is refused, as are
// those after stop(). Each is answered with {"path", "size_bytes", "seconds"} or {"error"}.
// A snapshot that cannot be written leaves no file, one error line in the log (a second at most),
// and the next is tried afresh.
//
// Any thread may call. Reporters may outlive the service.
class SnapshotDiagnosticReporterService final : public DiagnosticReporterService {
 public:
  SnapshotDiagnosticReporterService(SnapshotOptions options, SnapshotPartners partners);
  ~SnapshotDiagnosticReporterService() override;

  [[nodiscard]] std::shared_ptr<AILDiagnosticReporter> createReporter() override;
  // The source is asked on the thread of snapshots, until stop().
  void setStateSource(StateSource source) override;

  // Removes what a service that was killed left in work. Once, while nobody else uses the storage
  // directory.
  void removeLeftovers() const;
  // Breaks off the snapshot in work, which leaves nothing, and ends the thread. May be called
  // again. Not from a reply.
  void stop();

 private:
  class Worker;
  class Reporter;

  const std::shared_ptr<Worker> worker_;
};

}  // namespace halvox::platform::linux_
