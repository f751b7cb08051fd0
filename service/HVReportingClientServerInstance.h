#pragma once

#include <cstdint>
#include <deque>
#include <memory>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "platform/dispatch.h"
#include "platform/process.h"
#include "platform/value.h"
#include "service/HVReportingServiceDelegateProtocol.h"
#include "service/HVReportingServiceProtocol.h"
#include "service/ServiceCounters.h"
#include "session/Guarded.h"
#include "session/HVReportingSession.h"
#include "session/ResourceAccount.h"

namespace halvox {

// The service's side of one client's connection: owns the sessions that the client created and
// carries out its requests. A client may query, validate and send to the sessions of other clients,
// but change only its own.
//
// Requests arrive on the connection's thread, which only queues them. The work runs on the
// reporting queue, which also owns the map of sessions. While the summary file of a stop is being
// written elsewhere, the client's next requests wait, and other clients do not. Shared by its
// connection, by the delegate while it is registered, and by its queued requests: it is always held
// by a shared pointer. No operation fails: a request about an unknown session is answered without
// an error.
class HVReportingClientServerInstance final
    : public HVReportingServiceProtocol,
      public std::enable_shared_from_this<HVReportingClientServerInstance> {
 public:
  using Session = std::shared_ptr<HVReportingSession>;
  using Counters = std::shared_ptr<const ServiceCounters>;
  using SessionMap = std::unordered_map<ReporterID, Session>;
  enum class Lookup : std::uint8_t { kOwnSessions, kAcrossAllClients };

  // Keeps `delegate` weakly. Without a delegate there are no other clients and reporting is
  // disabled. `counters` are shared by all clients.
  HVReportingClientServerInstance(platform::ProcessID pid,
                                  std::weak_ptr<HVReportingServiceDelegateProtocol> delegate,
                                  Counters counters);
  HVReportingClientServerInstance(const HVReportingClientServerInstance&) = delete;
  HVReportingClientServerInstance& operator=(const HVReportingClientServerInstance&) = delete;
  ~HVReportingClientServerInstance() override;

  [[nodiscard]] platform::ProcessID processIdentifier() const { return processIdentifier_; }
  // When the client was registered; none before. Any thread.
  [[nodiscard]] std::optional<platform::Date> clientStartDate() const;
  void setClientStartDate(platform::Date date);
  // The name of the client's process; none before the registration, or if the process had already
  // ended by then. Any thread.
  [[nodiscard]] std::optional<std::string> clientProcessName() const;
  void setClientProcessName(std::optional<std::string> name);
  // Reporting queue only.
  [[nodiscard]] const SessionMap& clientReportingSessionMap() const { return sessions_; }

  // Looks for a session of this client and then, with kAcrossAllClients, for one of any client.
  // Null if there is none. Reporting queue only.
  [[nodiscard]] Session findReportingSessionForID(ReporterID reporterID, Lookup lookup) const;
  // The connection was interrupted or has ended. Queues a job that stops and drops all sessions and
  // removes the client from the service. A second call does nothing. Any thread.
  void handleConnectionError();

  void createReportingSession(ReporterID reporterID, BoolReply reply,
                              RequestContext context) override;
  void setServiceType(AudioServiceType serviceType, ReporterID reportingSession, BoolReply reply,
                      RequestContext context) override;
  void getServiceNameForReporterID(ReporterID reporterID, ServiceTypeReply reply,
                                   RequestContext context) override;
  void setConfiguration(platform::Dictionary configuration, ReporterID reporterID, BoolReply reply,
                        RequestContext context) override;
  void startReportingSessionForID(ReporterID reporterID, BoolReply reply,
                                  RequestContext context) override;
  void sendMessage(platform::Message message, AudioEventCategory category, AudioEventType type,
                   ReporterIDs reporterIDs, ErrorReply reply, RequestContext context) override;
  void postMessage(platform::Message message, AudioEventCategory category, AudioEventType type,
                   std::optional<platform::Array> reporterIDs, platform::PostedRequest request,
                   platform::ProcessID sender) override;
  void endOfRequests() override;
  void stopReportingSessionForID(ReporterID reporterID, BoolReply reply,
                                 RequestContext context) override;
  void destroyReportingSession(ReporterID reporterID, BoolReply reply,
                               RequestContext context) override;
  void reporterIDValid(ReporterID reporterID, DictionaryReply reply,
                       RequestContext context) override;
  void getAllReporters(ReportersReply reply, RequestContext context) override;
  void killService(BoolReply reply) override;

  [[nodiscard]] platform::ResourceUse resourceUse() const override { return account_->use(); }

 private:
  using Delegate = std::shared_ptr<HVReportingServiceDelegateProtocol>;
  // A request to send one message.
  struct MessageRequest {
    platform::Message message;
    AudioEventCategory category;
    AudioEventType type;
    std::optional<platform::Array> reporterIDs;
    std::optional<std::string> senderProcessName;  // none: unknown or not needed
    platform::PostedRequest request;
    ResourceCharge charge;  // for the message, until the request has been carried out
  };
  // Messages that one job sends.
  using Messages = std::vector<MessageRequest>;
  // Empty lists with reserved room, for any client. They belong to the process, because a client
  // that once sent much must not keep memory for ever.
  static Guarded<std::vector<Messages>>& spareMessages();

  // The queued work of a request.
  template <typename Work>
  struct RequestJob;
  // Queues `work`, which is called with this client, on the reporting queue. Keeps the client and
  // the request's token until then.
  template <typename Work>
  void queueRequest(platform::JobWeight weight, RequestContext&& context, Work work);
  // Queues a request that needs only a reporter ID and its reply.
  template <typename Member, typename Reply>
  void queueRequest(platform::JobWeight weight, RequestContext&& context, Member carryOut,
                    ReporterID reporterID, Reply&& reply);

  // Counts a request whose work has returned. If the work began a stop whose file is still being
  // written, keeps the token and counts the request when the stop is complete.
  void noteCarriedOut(platform::RequestToken token);

  // The work of the requests, on the reporting queue.
  void carryOutCreate(ReporterID reporterID, const BoolReply& reply);
  void carryOutSetServiceType(AudioServiceType serviceType, ReporterID reporterID,
                              const BoolReply& reply);
  void carryOutGetServiceName(ReporterID reporterID, const ServiceTypeReply& reply) const;
  void carryOutSetConfiguration(const platform::Dictionary& configuration, ReporterID reporterID,
                                const BoolReply& reply);
  void carryOutStart(ReporterID reporterID, const BoolReply& reply);
  void carryOutSend(MessageRequest& request);
  void carryOutSends(Messages& messages);
  void carryOutStop(ReporterID reporterID, const BoolReply& reply);
  void carryOutDestroy(ReporterID reporterID, const BoolReply& reply);
  void carryOutReporterIDValid(ReporterID reporterID, const DictionaryReply& reply) const;
  void carryOutGetAllReporters(const ReportersReply& reply) const;
  void carryOutConnectionError();

  // A stop whose summary file is not complete.
  struct OpenStop {
    std::shared_ptr<SessionStop> rest;
    platform::Job finished;
    std::optional<platform::RequestToken> request{};  // of the request that began the stop
  };
  // Stops a started session. Returns true if the stop is complete. Otherwise the session is stopped
  // for all other clients, but its summary file is still being written. This client's requests wait
  // until the file is complete and `finished` has run, on the reporting queue.
  [[nodiscard]] bool stop(const Session& session, platform::Job finished);
  void writeFile(const std::shared_ptr<SessionStop>& rest);
  void finishStop();
  [[nodiscard]] bool isStopping() const { return stop_.has_value(); }
  // Stops these sessions, one after the other, from the position `next` on. Returns true if all
  // stops are complete. Otherwise goes on when the file is complete, and then ends the clean-up.
  [[nodiscard]] bool stopSessions(const std::shared_ptr<std::vector<Session>>& sessions,
                                  std::size_t next);
  void endCleanUp(std::vector<Session>& sessions) const;
  // Keeps the job until the client's stop is complete.
  void postpone(platform::Job job);
  void carryOutPostponed();

  // Starts a session that is not started, and holds `reply` back until its stop.
  void begin(const Session& session, const Delegate& delegate, const BoolReply& reply);
  // The three ways of a message: to the sessions that it names, to all started sessions if it names
  // none, and to no session if none is started.
  void sendToNamedSessions(const MessageRequest& request, const Delegate& delegate) const;
  void sendToActiveSessions(const MessageRequest& request, const Delegate& delegate) const;
  void sendStandalone(const MessageRequest& request, const Delegate& delegate) const;
  // Offers the message to each back-end once for this session.
  void handToBackEnds(const MessageRequest& request, const Session& session,
                      const Delegate& delegate) const;

  // All changes of the map and of its sessions' states go through these functions, which keep the
  // delegate's index and the client's account up to date.
  void putSession(const Session& session, const Delegate& delegate);
  void removeSession(SessionMap::iterator place, const Delegate& delegate);
  void note(const Session& session, SessionChange change, const Delegate& delegate) const;

  const platform::ProcessID processIdentifier_;
  const std::weak_ptr<HVReportingServiceDelegateProtocol> delegate_;
  const Counters counters_;
  const std::shared_ptr<ResourceAccount> account_ = std::make_shared<ResourceAccount>();
  Guarded<std::optional<platform::Date>> clientStartDate_;
  Guarded<std::optional<std::string>> clientProcessName_;
  // Reporting queue only.
  SessionMap sessions_;
  std::optional<OpenStop> stop_;
  std::deque<platform::Job> postponed_;  // its requests and clean-up meanwhile
  Messages posted_;                      // connection's thread only; not queued yet
};

}  // namespace halvox
