#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string_view>

#include "backends/HVReportingVocabulary.h"
#include "platform/value.h"

namespace halvox::platform {
class AILDiagnosticReporter;
}

namespace halvox {

class HVReportingSession;

// Counts distinct reports of haptics sessions that were left running, and at the second one asks
// the bug-capture service for a snapshot and begins anew. A repeat of the counted report does not
// count; the report that brought the snapshot is not remembered.
//
//   nothing counted --first report--> one counted --another report--> snapshot, nothing counted
//
// Each property may be read and written from any thread, but reports belong to one serial queue:
// nothing holds a lock from reading the state to changing it. Held by the service's delegate.
// Reports no failure: what became of a snapshot is only logged.
class HVReportingUtilityVEKStateManager {
 public:
  using Reporter = std::shared_ptr<platform::AILDiagnosticReporter>;

  HVReportingUtilityVEKStateManager() = default;
  HVReportingUtilityVEKStateManager(const HVReportingUtilityVEKStateManager&) = delete;
  HVReportingUtilityVEKStateManager& operator=(const HVReportingUtilityVEKStateManager&) = delete;

  // Takes a message of a session, which is not null, that a process of that name sent. Does nothing
  // unless it is of type kJoulebook and tells of a session left running. Never waits.
  void handleEvent(const platform::Message& message, AudioEventCategory category,
                   AudioEventType type, const std::shared_ptr<HVReportingSession>& session,
                   std::string_view processName);

  // Distinct reports since the last snapshot.
  [[nodiscard]] std::uint64_t leakedHapticsSessionCounter() const;
  void setLeakedHapticsSessionCounter(std::uint64_t count);
  // The reporter of the last snapshot, or null.
  [[nodiscard]] Reporter ailmentReporter() const;
  void setAilmentReporter(Reporter reporter);
  // The report that was counted, or an empty dictionary.
  [[nodiscard]] platform::Dictionary messageCache() const;
  void setMessageCache(platform::Dictionary message);

 private:
  void takeSnapshot(AudioEventCategory category, const HVReportingSession& session,
                    std::string_view processName);

  std::atomic<std::uint64_t> leakedHapticsSessionCounter_{0};  // orders with nothing
  mutable std::mutex mutex_;  // held only to copy or exchange what follows
  Reporter ailmentReporter_;
  platform::Dictionary messageCache_;
};

}  // namespace halvox
