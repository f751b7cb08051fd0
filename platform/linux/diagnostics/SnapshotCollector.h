#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "platform/diagnostic_reporter.h"
#include "platform/linux/base/Result.h"
#include "platform/linux/diagnostics/BoundedFile.h"
#include "platform/linux/diagnostics/SnapshotArchive.h"
#include "platform/linux/diagnostics/SystemFacts.h"
#include "platform/linux/diagnostics/WaitableFlag.h"
#include "platform/linux/log/LogMemory.h"
#include "platform/linux/store/PayloadEncoder.h"
#include "platform/value.h"

namespace halvox::platform::linux_ {

// The request of a client. All of it is stored in the archive.
struct SnapshotRequest {
  Date time;
  Dictionary signature;
  double durationSeconds = 0;  // recorded only: a snapshot shows one moment
  std::optional<Dictionary> event{};
  std::optional<Dictionary> payload{};
};

// The sources of the parts of a snapshot, and the time limits of two parts.
struct SnapshotSources {
  SystemPaths paths;
  std::function<LogMemory::Contents()> log{};      // empty: no log is kept in memory
  DiagnosticReporterService::StateSource state{};  // empty: no service has set one
  std::chrono::milliseconds stateWithin{2000};
  std::chrono::milliseconds dumpWithin{3000};
};

// Collects the parts of one snapshot into an archive. The last part is a manifest, which lists each
// part with its size and the time that it took, or with the reason why it is missing. A part that
// cannot be collected, or for which no time or no space in the archive remains, is not a failure of
// the snapshot. Made for one snapshot. Belongs to the thread that takes it.
class SnapshotCollector {
 public:
  // Does not own its arguments, which must outlive it.
  SnapshotCollector(const SnapshotRequest& request, const SnapshotSources& sources,
                    SnapshotArchive& archive, const CaptureDeadline& deadline);

  // Collects all parts; call it once. Stops collecting at the deadline, but may block longer on the
  // disk. Fails if the archive cannot be written or the service is ending.
  Result<void> collect();

 private:
  using Clock = CaptureDeadline::Clock;

  void addSignature();
  void addRequest();
  void addState();
  void addLog();
  void addProcess();
  void addSystem();
  void addSound();
  void addManifest();
  void addPart(const char* name, const std::function<Finding()>& find);
  void note(const std::string& name, const Finding& finding, Clock::duration took);
  [[nodiscard]] Finding findState();
  [[nodiscard]] Finding findProcess();
  [[nodiscard]] std::string json(const Dictionary& dictionary);
  [[nodiscard]] bool isOver() const { return !result_; }

  const SnapshotRequest& request_;
  const SnapshotSources& sources_;
  SnapshotArchive& archive_;
  const CaptureDeadline& deadline_;
  const Clock::time_point begun_ = Clock::now();
  PayloadEncoder encoder_;
  std::vector<Value> items_;  // the entries of the manifest
  Result<void> result_;
};

}  // namespace halvox::platform::linux_
