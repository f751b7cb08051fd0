#pragma once

#include <cstdint>
#include <memory>
#include <string_view>
#include <vector>

#include "backends/HVReportingVocabulary.h"
#include "platform/value.h"
#include "session/DriverSnapShot.h"

namespace halvox {

class HVReportingClientServerInstance;
class HVReportingSession;

// A session entered its client's map or left it, or was started or stopped.
enum class SessionChange : std::uint8_t { kAdded, kRemoved, kStarted, kStopped };

// What client objects need from the service as a whole. Implemented by the delegate, which owns
// everything that is returned. Call on the reporting queue, except where stated. No operation
// fails.
class HVReportingServiceDelegateProtocol {
 public:
  using Clients = std::vector<std::shared_ptr<HVReportingClientServerInstance>>;
  using Sessions = std::vector<std::shared_ptr<HVReportingSession>>;

  virtual ~HVReportingServiceDelegateProtocol() = default;

  // The settings as they were when the service started. Any thread.
  [[nodiscard]] virtual const platform::Dictionary& getDefaults() const = 0;
  // Reads the watched settings and adds the time of reading; none if no setting has a value. Reads
  // files.
  [[nodiscard]] virtual platform::Message getFeaturesState() const = 0;
  // The connected clients in the order of their registration. This is the list itself, not a copy.
  [[nodiscard]] virtual const Clients& getAllClients() const = 0;
  // Whether reporting is enabled. Any thread.
  [[nodiscard]] virtual bool isReportingEnabled() const = 0;
  // The started sessions: clients in the order of their registration, the sessions of one client in
  // no particular order. Logs the sessions of each client.
  [[nodiscard]] virtual Sessions getAllActiveReportingSessions() const = 0;
  // Returns the session with this ID. If several clients have such a session, returns that of the
  // client that registered first. Null if there is none, for ID 0, and while reporting is disabled.
  [[nodiscard]] virtual std::shared_ptr<HVReportingSession> findReportingSessionForID(
      ReporterID reporterID) const = 0;
  // Removes a client from the list.
  virtual void removeClient(const HVReportingClientServerInstance& client) = 0;
  // The number of sessions that were started and not stopped by a request. Sessions that are
  // destroyed or lose their connection stay counted; this is required. Any thread.
  [[nodiscard]] virtual std::int64_t activeSessionCount() const = 0;
  virtual void setActiveSessionCount(std::int64_t count) = 0;

  // What the drivers have counted up to now. Waits a bounded time for each source of counters.
  [[nodiscard]] virtual DriverSnapShot getSnapShot() const = 0;
  // Sends what the drivers counted since the session's snapshot, through the session and to the
  // analytics service. Waits as above.
  virtual void sendDriverLogsForSession(const std::shared_ptr<HVReportingSession>& session) = 0;
  // Passes a message of a session to the bug capture, on internal builds only. `processName` is the
  // name of the process that sent it; null if unknown.
  virtual void handleEventForVEK(const platform::Message& message, AudioEventCategory category,
                                 AudioEventType type,
                                 const std::shared_ptr<HVReportingSession>& session,
                                 std::optional<std::string_view> processName) = 0;
  // Clients report every change of their sessions, so that the look-ups above need not walk all
  // clients. Ignored for a client that is not in the list.
  virtual void noteSessionChange(const HVReportingClientServerInstance& client,
                                 const std::shared_ptr<HVReportingSession>& session,
                                 SessionChange change) = 0;
};

}  // namespace halvox
