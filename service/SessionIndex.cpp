#include "service/SessionIndex.h"

#include <algorithm>

#include "session/HVReportingSession.h"

namespace halvox {

void SessionIndex::addClient(const Client& client) {
  // Places are never reused, because a client that reconnects must come after all others.
  places_.emplace(&client, static_cast<Place>(++placesGiven_));
}

void SessionIndex::removeClient(const Client& client, const std::vector<Session>& sessions) {
  for (const Session& session : sessions) noteChange(client, session, SessionChange::kRemoved);
  places_.erase(&client);
}

void SessionIndex::noteChange(const Client& client, const Session& session, SessionChange change) {
  const auto known = places_.find(&client);
  if (known == places_.end()) return;
  const Place place = known->second;
  switch (change) {
    case SessionChange::kAdded:
      add(place, client, session);
      return;
    case SessionChange::kRemoved:
      remove(place, session);
      return;
    case SessionChange::kStarted:
      started_[place].insert_or_assign(session->reporterID(), session);
      return;
    case SessionChange::kStopped:
      removeStarted(place, session);
      return;
  }
}

void SessionIndex::add(Place place, const Client& client, const Session& session) {
  Holders& holders = holders_[session->reporterID()];
  // The client that was registered first stays in front, whichever created its session first.
  const auto later = std::ranges::upper_bound(holders, place, {}, &Holder::place);
  holders.insert(later, Holder{place, &client, session});
}

void SessionIndex::remove(Place place, const Session& session) {
  removeStarted(place, session);
  const auto known = holders_.find(session->reporterID());
  if (known == holders_.end()) return;
  std::erase_if(known->second, [&](const Holder& holder) { return holder.session == session; });
  if (known->second.empty()) holders_.erase(known);
}

void SessionIndex::removeStarted(Place place, const Session& session) {
  const auto ofClient = started_.find(place);
  if (ofClient == started_.end()) return;
  const auto known = ofClient->second.find(session->reporterID());
  // Another session may have taken the ID meanwhile; that one stays.
  if (known == ofClient->second.end() || known->second != session) return;
  ofClient->second.erase(known);
  if (ofClient->second.empty()) started_.erase(ofClient);
}

SessionIndex::Found SessionIndex::find(ReporterID reporterID) const {
  const auto known = holders_.find(reporterID);
  if (known == holders_.end()) return {};
  const Holder& first = known->second.front();
  return {first.client, first.session};
}

std::vector<SessionIndex::Session> SessionIndex::activeSessions() const {
  std::vector<Session> sessions;
  for (const auto& [place, ofClient] : started_) {
    for (const auto& [reporterID, session] : ofClient) sessions.push_back(session);
  }
  return sessions;
}

void SessionIndex::appendActiveSessions(const Client& client,
                                        std::vector<Session>& sessions) const {
  const auto known = places_.find(&client);
  if (known == places_.end()) return;
  const auto ofClient = started_.find(known->second);
  if (ofClient == started_.end()) return;
  for (const auto& [reporterID, session] : ofClient->second) sessions.push_back(session);
}

}  // namespace halvox
