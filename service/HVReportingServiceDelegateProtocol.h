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

// What happened to a session of a client: it entered the client's map or left it, was started or
// stopped.
enum class SessionChange : std::uint8_t { kAdded, kRemoved, kStarted, kStopped };

// What client objects ask of the whole service. All on the reporting queue, except where stated.
class HVReportingServiceDelegateProtocol {
 public:
  using Clients = std::vector<std::shared_ptr<HVReportingClientServerInstance>>;
  using Sessions = std::vector<std::shared_ptr<HVReportingSession>>;

  virtual ~HVReportingServiceDelegateProtocol() = default;

  // The settings as they were at the start. Any thread.
  [[nodiscard]] virtual const platform::Dictionary& getDefaults() const = 0;
  // The watched settings as they are now with the time of reading, or none when none of them is
  // set. Reads files.
  [[nodiscard]] virtual platform::Message getFeaturesState() const = 0;
  // The connected clients in the order of their registration: the list itself, not a copy.
  [[nodiscard]] virtual const Clients& getAllClients() const = 0;
  // Whether reporting is switched on. Any thread.
  [[nodiscard]] virtual bool isReportingEnabled() const = 0;
  // The sessions that are started: clients in the order of their registration, the sessions of one
  // client in no particular order. Logs what it finds at every client.
  [[nodiscard]] virtual Sessions getAllActiveReportingSessions() const = 0;
  // The session of that ID, of the client that was registered first among those that have one; null
  // when there is none, for ID 0, and while reporting is switched off.
  [[nodiscard]] virtual std::shared_ptr<HVReportingSession> findReportingSessionForID(
      ReporterID reporterID) const = 0;
  // Takes a client out of the list.
  virtual void removeClient(const HVReportingClientServerInstance& client) = 0;
  // Sessions that were started and not explicitly stopped. A plain counter that only the requests
  // to start and stop change: sessions that end in another way stay counted. Any thread.
  [[nodiscard]] virtual std::int64_t activeSessionCount() const = 0;
  virtual void setActiveSessionCount(std::int64_t count) = 0;

  // What the drivers have counted up to now. Waits for the sources of the counters, a moment at
  // most for each.
  [[nodiscard]] virtual DriverSnapShot getSnapShot() const = 0;
  // Sends what the drivers counted since the session's snapshot, through it and to the analytics
  // service. Waits as above.
  virtual void sendDriverLogsForSession(const std::shared_ptr<HVReportingSession>& session) = 0;
  // Hands a message of a session, that a process of that name sent, to the bug capture; the name is
  // null when it is not known. Does nothing on builds that are not internal.
  virtual void handleEventForVEK(const platform::Message& message, AudioEventCategory category,
                                 AudioEventType type,
                                 const std::shared_ptr<HVReportingSession>& session,
                                 std::optional<std::string_view> processName) = 0;
  // Clients tell of every change of their sessions, so that the look-ups above need not walk all
  // clients. Without effect for a client that is not in the list.
  virtual void noteSessionChange(const HVReportingClientServerInstance& client,
                                 const std::shared_ptr<HVReportingSession>& session,
                                 SessionChange change) = 0;
};

}  // namespace halvox
