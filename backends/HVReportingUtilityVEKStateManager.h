#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <string_view>

#include "backends/BackEndCounters.h"
#include "backends/HVReportingVocabulary.h"
#include "platform/value.h"

namespace halvox::platform {
class AILDiagnosticReporter;
}

namespace halvox {

class HVReportingSession;

// Counts distinct reports of haptics sessions that were left running. At the second distinct report
// it requests a snapshot from the bug-capture service and starts again. A repeat of the counted
// report is ignored. The report that caused the snapshot is deliberately not remembered: when it
// comes again, it counts as a first report.
//
//   nothing counted --first report--> one counted --another report--> snapshot, nothing counted
//
// Each property may be read and written on any thread. handleEvent() must be called on one serial
// queue, because it holds no lock between reading the state and changing it. Owned by the service's
// delegate. Returns no error: the outcome of a snapshot is only logged.
class HVReportingUtilityVEKStateManager {
 public:
  using Reporter = std::shared_ptr<platform::AILDiagnosticReporter>;

  // Counts in `statistics`, which must outlive it.
  explicit HVReportingUtilityVEKStateManager(platform::StatisticsService& statistics);
  HVReportingUtilityVEKStateManager(const HVReportingUtilityVEKStateManager&) = delete;
  HVReportingUtilityVEKStateManager& operator=(const HVReportingUtilityVEKStateManager&) = delete;

  // Returns true if a message of this type can report a session left running. The name of the
  // sender is used for these messages only.
  [[nodiscard]] static bool concerns(AudioEventType type) {
    return type == AudioEventType::kJoulebook;
  }
  // Handles a message that the process `processName` (null: unknown) sent through `session`, which
  // must not be null. Ignores messages of other types and messages without an active hardware time.
  // Does not block: the reply of the snapshot comes later, on another thread.
  void handleEvent(const platform::Message& message, AudioEventCategory category,
                   AudioEventType type, const std::shared_ptr<HVReportingSession>& session,
                   std::optional<std::string_view> processName);

  // The number of distinct reports since the last snapshot.
  [[nodiscard]] std::uint64_t leakedHapticsSessionCounter() const;
  void setLeakedHapticsSessionCounter(std::uint64_t count);
  // The reporter of the last snapshot, or null.
  [[nodiscard]] Reporter ailmentReporter() const;
  void setAilmentReporter(Reporter reporter);
  // The report that was counted last, or an empty dictionary.
  [[nodiscard]] platform::Dictionary messageCache() const;
  void setMessageCache(platform::Dictionary message);

 private:
  void takeSnapshot(AudioEventCategory category, const HVReportingSession& session,
                    std::optional<std::string_view> processName);

  const BugCaptureCounters counters_;
  std::atomic<std::uint64_t> leakedHapticsSessionCounter_{0};  // orders nothing else
  mutable std::mutex mutex_;  // held only to copy or exchange the members below
  Reporter ailmentReporter_;
  platform::Dictionary messageCache_;
};

}  // namespace halvox
