#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <unordered_map>
#include <vector>

#include "service/HVReportingServiceDelegateProtocol.h"

namespace halvox {

// Finds sessions across all registered clients. Gives the same answers as a walk over the clients
// in the order of their registration. Every message needs such an answer, and a walk would cost
// more with every client.
//
// Owned by the delegate; reporting queue only. Holds its sessions: a client must report every
// session that it drops. No operation fails.
class SessionIndex {
 public:
  using Client = HVReportingClientServerInstance;
  using Session = std::shared_ptr<HVReportingSession>;
  // A session and its client; both null if there is none.
  struct Found {
    const Client* client = nullptr;
    Session session;
  };

  // Adds a client without sessions, after all others.
  void addClient(const Client& client);
  // Removes a client and its sessions. The caller names the sessions, because finding them here
  // would take a walk.
  void removeClient(const Client& client, const std::vector<Session>& sessions);
  // Records a change of a client's session. Ignored for a client that is not registered.
  void noteChange(const Client& client, const Session& session, SessionChange change);

  // Returns the session with this ID. If several clients have such a session, returns that of the
  // client that registered first.
  [[nodiscard]] Found find(ReporterID reporterID) const;
  // All started sessions, in the order in which their clients were registered.
  [[nodiscard]] std::vector<Session> activeSessions() const;
  // Appends the started sessions of one client.
  void appendActiveSessions(const Client& client, std::vector<Session>& sessions) const;

 private:
  // The place of a client in the order of registration.
  enum class Place : std::uint64_t {};
  struct Holder {
    Place place;
    const Client* client;  // held by the delegate while it is registered
    Session session;
  };
  using Holders = std::vector<Holder>;  // sorted by place
  using StartedSessions = std::map<ReporterID, Session>;

  // These keep holders_ and started_ consistent; an ID without holders has no entry.
  void add(Place place, const Client& client, const Session& session);
  void remove(Place place, const Session& session);
  void removeStarted(Place place, const Session& session);

  std::uint64_t placesGiven_ = 0;
  std::unordered_map<const Client*, Place> places_;
  std::unordered_map<ReporterID, Holders> holders_;
  std::map<Place, StartedSessions> started_;  // only clients that have any
};

}  // namespace halvox
