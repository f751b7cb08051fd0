#pragma once

#include <functional>
#include <optional>
#include <vector>

#include "backends/HVReportingVocabulary.h"
#include "platform/connection.h"
#include "platform/value.h"
#include "session/ReplyCallbacks.h"

namespace halvox {

// What clients can ask of the service. A request for a reporter ID that is unknown, or 0, is not an
// error: it is answered like one that succeeded, or with a default value.
//
// The operations run on the connection's thread and return at once; replies come later from another
// thread, except where stated. No reply is empty.
class HVReportingServiceProtocol : public platform::ExportedObject {
 public:
  using ServiceTypeReply = std::function<void(const std::optional<platform::Error>& error,
                                              AudioServiceType serviceType)>;
  using DictionaryReply = std::function<void(const std::optional<platform::Error>& error,
                                             const platform::Dictionary& dictionary)>;
  using ReportersReply = std::function<void(const std::optional<platform::Error>& error,
                                            const std::vector<ReporterID>& reporters)>;
  // None is not the same as an empty list: it means all active sessions.
  using ReporterIDs = std::optional<std::vector<ReporterID>>;

  // Makes a session under an ID that the client chose, in the place of an older one.
  virtual void createReportingSession(ReporterID reporterID, BoolReply reply) = 0;
  virtual void setServiceType(AudioServiceType serviceType, ReporterID reportingSession,
                              BoolReply reply) = 0;
  // Answers the service type, in spite of its name. Replies twice for ID 0.
  virtual void getServiceNameForReporterID(ReporterID reporterID, ServiceTypeReply reply) = 0;
  // Adds entries to the configuration of one of the client's sessions.
  virtual void setConfiguration(platform::Dictionary configuration, ReporterID reporterID,
                                BoolReply reply) = 0;
  // Starts one of the client's sessions. The reply is held back until the session is stopped, so
  // that the client learns when all of it is done.
  virtual void startReportingSessionForID(ReporterID reporterID, BoolReply reply) = 0;
  // Hands a message to the back-ends and to the sessions named, whichever client made them, or to
  // all active ones when none are named.
  virtual void sendMessage(platform::Message message, AudioEventCategory category,
                           AudioEventType type, ReporterIDs reporterIDs, ErrorReply reply) = 0;
  virtual void stopReportingSessionForID(ReporterID reporterID, BoolReply reply) = 0;
  virtual void destroyReportingSession(ReporterID reporterID, BoolReply reply) = 0;
  // Answers "reporterID" and "serviceType" of a session, 0 and 65535 when there is none.
  virtual void reporterIDValid(ReporterID reporterID, DictionaryReply reply) = 0;
  // Answers the IDs of all sessions of all clients.
  virtual void getAllReporters(ReportersReply reply) = 0;
  // Ends the service at once. Never replies. Connections deliver it from the service's owner only.
  virtual void killService(BoolReply reply) = 0;
};

// The protocol as connections export it: an object of it must be a HVReportingServiceProtocol.
const platform::NSXPCInterface& HVReportingServiceInterface();

}  // namespace halvox
