#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <unordered_map>
#include <vector>

#include "service/HVReportingServiceDelegateProtocol.h"

namespace halvox {

// Which registered clients have which sessions, and which of these are started: the answers that a
// walk over all clients in the order of their registration would give, without the walk, because
// they are needed for every message. Belongs to the delegate and the reporting queue.
class SessionIndex {
 public:
  using Client = HVReportingClientServerInstance;
  using Session = std::shared_ptr<HVReportingSession>;
  // A session and the client that has it; both null when there is none.
  struct Found {
    const Client* client = nullptr;
    Session session;
  };

  // A client without sessions was registered, after all others.
  void addClient(const Client& client);
  // Forgets a client and its sessions, which are given because the client knows them.
  void removeClient(const Client& client, const std::vector<Session>& sessions);
  // A session of a client changed; ignored for a client that is not registered.
  void noteChange(const Client& client, const Session& session, SessionChange change);

  // The session of that ID, of the client registered first among those that have one.
  [[nodiscard]] Found find(ReporterID reporterID) const;
  // All started sessions: clients in the order of their registration.
  [[nodiscard]] std::vector<Session> activeSessions() const;
  // Adds the started sessions of one client.
  void appendActiveSessions(const Client& client, std::vector<Session>& sessions) const;

 private:
  // The place of a client in the order of registration.
  enum class Place : std::uint64_t {};
  struct Holder {
    Place place;
    const Client* client;  // registered, hence held by the delegate
    Session session;
  };
  using Holders = std::vector<Holder>;  // by place
  using StartedSessions = std::map<ReporterID, Session>;

  void add(Place place, const Client& client, const Session& session);
  void remove(Place place, const Session& session);
  void removeStarted(Place place, const Session& session);

  std::uint64_t placesGiven_ = 0;
  std::unordered_map<const Client*, Place> places_;
  std::unordered_map<ReporterID, Holders> holders_;
  std::map<Place, StartedSessions> started_;  // only clients that have any
};

}  // namespace halvox
