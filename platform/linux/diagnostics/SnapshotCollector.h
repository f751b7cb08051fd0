#pragma once

#include <chrono>
#include <cstdint>
#include <functional>
#include <optional>
#include <string>
#include <vector>

#include "platform/diagnostic_reporter.h"
#include "platform/linux/diagnostics/BoundedFile.h"
#include "platform/linux/diagnostics/SnapshotArchive.h"
#include "platform/linux/diagnostics/SystemFacts.h"
#include "platform/linux/diagnostics/WaitableFlag.h"
#include "platform/linux/runtime/LogMemory.h"
#include "platform/linux/store/PayloadEncoder.h"
#include "platform/value.h"

namespace halvox::platform::linux_ {

// What is to be captured, and for what.
struct SnapshotRequest {
  Date time;
  Dictionary signature;
  double durationSeconds = 0;
  std::optional<Dictionary> event{};
  std::optional<Dictionary> payload{};
};

// Where the parts of a snapshot come from.
struct SnapshotSources {
  SystemPaths paths;
  std::function<LogMemory::Contents()> log{};  // empty: there is none
  DiagnosticReporterService::StateSource state{};
  std::chrono::milliseconds stateWithin{2000};
  std::chrono::milliseconds dumpWithin{3000};
};

// Puts all parts of one snapshot into an archive, in the end a manifest with each part's size and
// time or why it is missing. A part that cannot be had, or for which there is no time or room left,
// is such an entry and no failure. Used once, on one thread.
class SnapshotCollector {
 public:
  // All must outlive it.
  SnapshotCollector(const SnapshotRequest& request, const SnapshotSources& sources,
                    SnapshotArchive& archive, const Deadline& deadline);

  // Why the archive could not be written, or that the service is ending; none when all went well.
  [[nodiscard]] std::optional<std::string> collect();

 private:
  using Clock = Deadline::Clock;

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
  [[nodiscard]] bool isOver() const { return failure_.has_value(); }

  const SnapshotRequest& request_;
  const SnapshotSources& sources_;
  SnapshotArchive& archive_;
  const Deadline& deadline_;
  const Clock::time_point begun_ = Clock::now();
  PayloadEncoder encoder_;
  std::vector<Value> items_;  // of the manifest
  std::optional<std::string> failure_;
};

}  // namespace halvox::platform::linux_
