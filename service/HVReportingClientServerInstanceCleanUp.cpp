#include <algorithm>
#include <utility>

#include "service/HVReportingClientServerInstance.h"
#include "service/ReportingQueue.h"
#include "service/ServiceLog.h"

// How sessions enter and leave a client, and how a client leaves the service.
namespace halvox {

void HVReportingClientServerInstance::putSession(const Session& session, const Delegate& delegate) {
  session->chargeTo(account_);
  Session& place = sessions_[session->reporterID()];
  // A session that already has this ID is dropped without being stopped, even if it is started.
  // This is required.
  if (place != nullptr) note(place, SessionChange::kRemoved, delegate);
  place = session;
  note(session, SessionChange::kAdded, delegate);
  account_->setSessions(sessions_.size());
}

void HVReportingClientServerInstance::removeSession(SessionMap::iterator place,
                                                    const Delegate& delegate) {
  note(place->second, SessionChange::kRemoved, delegate);
  sessions_.erase(place);
  account_->setSessions(sessions_.size());
}

void HVReportingClientServerInstance::note(const Session& session, SessionChange change,
                                           const Delegate& delegate) const {
  if (delegate != nullptr) delegate->noteSessionChange(*this, session, change);
}

void HVReportingClientServerInstance::handleConnectionError() {
  // The job is not brief, because it stops sessions. It holds the client, because the connection
  // may release the client before the job runs.
  reportingQueue()->async(platform::JobWeight::kMayBlock,
                          [client = shared_from_this()] { client->carryOutConnectionError(); });
}

void HVReportingClientServerInstance::carryOutConnectionError() {
  const Delegate delegate = delegate_.lock();
  if (delegate == nullptr) return;
  // An interruption and the end of the connection both lead here. The second call finds the client
  // removed and does nothing.
  const auto& clients = delegate->getAllClients();
  if (std::ranges::none_of(clients, [this](const auto& one) { return one.get() == this; })) return;
  // As for a destroyed session, the counter of active sessions does not change and held replies are
  // dropped. Both are required.
  for (const auto& [reporterID, session] : sessions_) {
    if (session->started()) session->stop();
  }
  // Sessions are removed only after all of them have been stopped; this order is required.
  while (!sessions_.empty()) removeSession(sessions_.begin(), delegate);
  delegate->removeClient(*this);
  kServiceLog.notice("removing ", processIdentifier_, " from the server client list");
}

}  // namespace halvox
