#pragma once

#include <functional>
#include <optional>
#include <vector>

#include "backends/HVReportingVocabulary.h"
#include "platform/connection.h"
#include "platform/value.h"
#include "session/ReplyCallbacks.h"

namespace halvox {

// What clients can ask of the service. A request about an unknown reporter ID, or about 0, is not
// an error: it is answered like one that succeeded, or with a default value.
//
// The operations run on the connection's thread and return at once. They call their reply later, on
// another thread, with the error first. No reply is empty. They keep the token of `context` until
// their work has been carried out.
class HVReportingServiceProtocol : public platform::ExportedObject {
 public:
  using RequestContext = platform::RequestContext;
  using ServiceTypeReply = std::function<void(const std::optional<platform::Error>& error,
                                              AudioServiceType serviceType)>;
  using DictionaryReply = std::function<void(const std::optional<platform::Error>& error,
                                             const platform::Dictionary& dictionary)>;
  using ReportersReply = std::function<void(const std::optional<platform::Error>& error,
                                            const std::vector<ReporterID>& reporters)>;
  // None means all active sessions. An empty list means no session.
  using ReporterIDs = std::optional<std::vector<ReporterID>>;

  // Creates a session under an ID that the client chose. Replaces a session that the client has
  // under this ID, without stopping it.
  virtual void createReportingSession(ReporterID reporterID, BoolReply reply,
                                      RequestContext context) = 0;
  // Sets the service type of one of the client's own sessions. Any number is accepted.
  virtual void setServiceType(AudioServiceType serviceType, ReporterID reportingSession,
                              BoolReply reply, RequestContext context) = 0;
  // Replies with the service type, not a name, and calls the reply twice for ID 0. Clients rely on
  // both.
  virtual void getServiceNameForReporterID(ReporterID reporterID, ServiceTypeReply reply,
                                           RequestContext context) = 0;
  // Adds entries to the configuration of one of the client's own sessions.
  virtual void setConfiguration(platform::Dictionary configuration, ReporterID reporterID,
                                BoolReply reply, RequestContext context) = 0;
  // Starts one of the client's own sessions. Replies when the session is stopped or started again,
  // which tells the client that the whole run is complete. If the session is destroyed instead, or
  // its connection ends, the reply is never called.
  virtual void startReportingSessionForID(ReporterID reporterID, BoolReply reply,
                                          RequestContext context) = 0;
  // Passes a message to the back-ends and to the named sessions, which may belong to any client.
  // Without names, passes it to all active sessions.
  virtual void sendMessage(platform::Message message, AudioEventCategory category,
                           AudioEventType type, ReporterIDs reporterIDs, ErrorReply reply,
                           RequestContext context) = 0;
  // Does the same for a request of a connection, whose arguments need no copy. Queues the work at
  // endOfRequests() or before another request. The messages of one read therefore become one job.
  virtual void postMessage(platform::Message message, AudioEventCategory category,
                           AudioEventType type, std::optional<platform::Array> reporterIDs,
                           platform::PostedRequest request, platform::ProcessID sender) = 0;
  // Stops one of the client's own sessions. The session stays and can be started again. The held
  // reply of its start is called first, then `reply`.
  virtual void stopReportingSessionForID(ReporterID reporterID, BoolReply reply,
                                         RequestContext context) = 0;
  // Stops one of the client's own sessions if it is started, and drops it. The held reply of its
  // start is never called.
  virtual void destroyReportingSession(ReporterID reporterID, BoolReply reply,
                                       RequestContext context) = 0;
  // Replies with "reporterID" and "serviceType" of a session; 0 and 65535 if there is none.
  virtual void reporterIDValid(ReporterID reporterID, DictionaryReply reply,
                               RequestContext context) = 0;
  // Replies with the IDs of all sessions of all clients.
  virtual void getAllReporters(ReportersReply reply, RequestContext context) = 0;
  // Ends the process at once with exit status 2. Never replies, and stops or flushes no session.
  // Connections deliver it only from root and the service's own user.
  virtual void killService(BoolReply reply) = 0;
};

// The protocol as connections export it. An object that is exported with it must be an
// HVReportingServiceProtocol.
const platform::NSXPCInterface& HVReportingServiceInterface();

}  // namespace halvox
