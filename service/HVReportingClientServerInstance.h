#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <unordered_map>

#include "platform/dispatch.h"
#include "platform/process.h"
#include "platform/value.h"
#include "service/HVReportingServiceDelegateProtocol.h"
#include "service/HVReportingServiceProtocol.h"
#include "session/Guarded.h"
#include "session/HVReportingSession.h"
#include "session/ResourceAccount.h"

namespace halvox {

// The service's side of one client's connection: the sessions that the client made, and what it
// asks of them. A client may read, validate and send to sessions of others, but change only its
// own.
//
// Requests arrive on the connection's thread, which only queues them; they are carried out on the
// reporting queue, where the map of sessions belongs. Held by its connection, by the delegate while
// it is registered, and by its queued requests; so it is always held by a shared pointer. Nothing
// here fails: what is asked about an unknown session is answered without an error.
class HVReportingClientServerInstance final
    : public HVReportingServiceProtocol,
      public std::enable_shared_from_this<HVReportingClientServerInstance> {
 public:
  using Session = std::shared_ptr<HVReportingSession>;
  using SessionMap = std::unordered_map<ReporterID, Session>;
  enum class Lookup : std::uint8_t { kOwnSessions, kAcrossAllClients };

  // Keeps `delegate` weakly; without it there are no other clients and reporting is off.
  HVReportingClientServerInstance(platform::ProcessID pid,
                                  std::weak_ptr<HVReportingServiceDelegateProtocol> delegate);
  HVReportingClientServerInstance(const HVReportingClientServerInstance&) = delete;
  HVReportingClientServerInstance& operator=(const HVReportingClientServerInstance&) = delete;
  ~HVReportingClientServerInstance() override;

  [[nodiscard]] platform::ProcessID processIdentifier() const { return processIdentifier_; }
  // When the client was registered; none before. Any thread.
  [[nodiscard]] std::optional<platform::Date> clientStartDate() const;
  void setClientStartDate(platform::Date date);
  // The name of the client's process; none before the registration and for a process that was gone
  // by then. Any thread.
  [[nodiscard]] std::optional<std::string> clientProcessName() const;
  void setClientProcessName(std::optional<std::string> name);
  // Reporting queue only.
  [[nodiscard]] const SessionMap& clientReportingSessionMap() const { return sessions_; }

  // A session of this client, or, when it has none of that ID and the look-up goes across all
  // clients, whatever the delegate finds. Null when there is none. Reporting queue only.
  [[nodiscard]] Session findReportingSessionForID(ReporterID reporterID, Lookup lookup) const;
  // The connection was interrupted or has ended: queues the stopping and dropping of all sessions
  // and the client's leave. May be called again, which does nothing. Any thread.
  void handleConnectionError();

  void createReportingSession(ReporterID reporterID, BoolReply reply) override;
  void setServiceType(AudioServiceType serviceType, ReporterID reportingSession,
                      BoolReply reply) override;
  void getServiceNameForReporterID(ReporterID reporterID, ServiceTypeReply reply) override;
  void setConfiguration(platform::Dictionary configuration, ReporterID reporterID,
                        BoolReply reply) override;
  void startReportingSessionForID(ReporterID reporterID, BoolReply reply) override;
  void sendMessage(platform::Message message, AudioEventCategory category, AudioEventType type,
                   ReporterIDs reporterIDs, ErrorReply reply) override;
  void stopReportingSessionForID(ReporterID reporterID, BoolReply reply) override;
  void destroyReportingSession(ReporterID reporterID, BoolReply reply) override;
  void reporterIDValid(ReporterID reporterID, DictionaryReply reply) override;
  void getAllReporters(ReportersReply reply) override;
  void killService(BoolReply reply) override;

  [[nodiscard]] platform::ResourceUse resourceUse() const override { return account_->use(); }

 private:
  using Delegate = std::shared_ptr<HVReportingServiceDelegateProtocol>;
  // One message on its way to the back-ends.
  struct MessageRequest {
    platform::Message message;
    AudioEventCategory category;
    AudioEventType type;
    ReporterIDs reporterIDs;
    std::optional<std::string> senderProcessName;  // none: unknown, or not used
    ErrorReply reply;
    ResourceCharge charge;  // for the message, until the request was carried out
  };

  template <typename Work>
  void queueRequest(platform::JobWeight weight, Work work);

  // The work of the requests, on the reporting queue.
  void carryOutCreate(ReporterID reporterID, const BoolReply& reply);
  void carryOutSetServiceType(AudioServiceType serviceType, ReporterID reporterID,
                              const BoolReply& reply);
  void carryOutGetServiceName(ReporterID reporterID, const ServiceTypeReply& reply) const;
  void carryOutSetConfiguration(const platform::Dictionary& configuration, ReporterID reporterID,
                                const BoolReply& reply);
  void carryOutStart(ReporterID reporterID, const BoolReply& reply);
  void carryOutSend(MessageRequest& request);
  void carryOutStop(ReporterID reporterID, const BoolReply& reply);
  void carryOutDestroy(ReporterID reporterID, const BoolReply& reply);
  void carryOutReporterIDValid(ReporterID reporterID, const DictionaryReply& reply) const;
  void carryOutGetAllReporters(const ReportersReply& reply) const;
  void carryOutConnectionError();

  void begin(const Session& session, const Delegate& delegate, const BoolReply& reply);
  void end(const Session& session, const Delegate& delegate);
  void sendToNamedSessions(const MessageRequest& request, const Delegate& delegate) const;
  void sendToActiveSessions(const MessageRequest& request, const Delegate& delegate) const;
  void sendStandalone(const MessageRequest& request, const Delegate& delegate) const;
  static void handToBackEnds(const MessageRequest& request, const Session& session,
                             const Delegate& delegate);

  // Changes of the map and of what is in it go through these, which tell the delegate and the
  // account.
  void putSession(const Session& session, const Delegate& delegate);
  void removeSession(SessionMap::iterator place, const Delegate& delegate);
  void note(const Session& session, SessionChange change, const Delegate& delegate) const;

  const platform::ProcessID processIdentifier_;
  const std::weak_ptr<HVReportingServiceDelegateProtocol> delegate_;
  const std::shared_ptr<ResourceAccount> account_ = std::make_shared<ResourceAccount>();
  Guarded<std::optional<platform::Date>> clientStartDate_;
  Guarded<std::optional<std::string>> clientProcessName_;
  SessionMap sessions_;  // reporting queue only
};

}  // namespace halvox
