#include <utility>
#include <vector>

#include "backends/HVReportingVocabulary.h"
#include "platform/feature_flags.h"
#include "platform/services.h"
#include "service/HVReportingClientServerInstance.h"
#include "service/ServiceLog.h"
#include "session/SessionLog.h"
#include "session/TracePoints.h"

// The work of all requests but sendMessage, on the reporting queue. Several log texts and repeated
// lines look like mistakes. They are part of the interface: tools match them.
namespace halvox {
namespace {

// While more sessions than this are counted as active, sessions are created and started without
// the real-time link.
constexpr std::int64_t kMaxSessionsWithLink = 5;

using Delegate = std::shared_ptr<HVReportingServiceDelegateProtocol>;

bool mayUseLink(const Delegate& delegate) {
  return delegate == nullptr || delegate->activeSessionCount() <= kMaxSessionsWithLink;
}

void addToActiveSessionCount(const Delegate& delegate, std::int64_t change) {
  if (delegate != nullptr) delegate->setActiveSessionCount(delegate->activeSessionCount() + change);
}

void logActiveSessions(const Delegate& delegate) {
  if (delegate == nullptr) return;
  const auto sessions = delegate->getAllActiveReportingSessions();
  kServiceLog.notice("", delegate->activeSessionCount(), " active reporting session(s) ",
                     sessionsDescription(sessions));
}

void deliverHeldReply(HVReportingSession& session, const ServiceCounters& counters) {
  const BoolReply held = session.takeTransactionCompleteBlock();
  if (!held) return;
  counters.startReplies.delivered.add();
  held(std::nullopt, true);
}

// Unlike a change of the features, a start sends nothing if no watched setting has a value. Both
// rules are required.
void sendFeaturesState(HVReportingSession& session, const Delegate& delegate) {
  if (delegate == nullptr) return;
  const platform::Message state = delegate->getFeaturesState();
  if (!state.has_value()) return;
  session.sendMessage(state, AudioEventCategory::kSetup, AudioEventType::kSetup, nullptr);
}

bool isTracingTest(const HVReportingSession& session) {
  return platform::featureFlags()._os_feature_enabled_impl("Acoustat", "Tracing") &&
         session.serviceType() == AudioServiceType::kTest;
}

}  // namespace

void HVReportingClientServerInstance::carryOutCreate(ReporterID reporterID,
                                                     const BoolReply& reply) {
  kServiceLog.debug("creating session for reporter ", number(reporterID));
  emitTracePoint(ReportingTracePoint::kCreateRequest);
  const Delegate delegate = delegate_.lock();
  // The ID is not checked: 0 and an ID in use are accepted. This is required.
  const auto session = std::make_shared<HVReportingSession>(
      reporterID, HVReportingSession::ProcessIdentifiers{processIdentifier_}, counters_->sessions);
  putSession(session, delegate);
  session->setTlmReportingEnabled(mayUseLink(delegate));
  kServiceLog.notice("session created for reporter ", number(reporterID));
  reply(std::nullopt, true);
}

void HVReportingClientServerInstance::carryOutSetServiceType(AudioServiceType serviceType,
                                                             ReporterID reporterID,
                                                             const BoolReply& reply) {
  kServiceLog.debug("setting service type ", number(serviceType), " for reporter ",
                    number(reporterID));
  const Session session = findReportingSessionForID(reporterID, Lookup::kOwnSessions);
  if (reporterID != kNoReporterID && session != nullptr) {
    session->setServiceType(serviceType);
    // The two blanks are part of the interface: tools match them.
    kServiceLog.notice("service type ", number(serviceType), " set for reporter  ",
                       number(reporterID));
  }
  reply(std::nullopt, true);
}

void HVReportingClientServerInstance::carryOutGetServiceName(ReporterID reporterID,
                                                             const ServiceTypeReply& reply) const {
  kServiceLog.debug("fetching seviceType");  // the spelling is required: tools match it
  // For ID 0 the reply is called here and again below. Clients rely on both calls.
  if (reporterID == kNoReporterID) reply(std::nullopt, AudioServiceType::kUnknown);
  const Session session = findReportingSessionForID(reporterID, Lookup::kAcrossAllClients);
  const AudioServiceType serviceType =
      session == nullptr ? AudioServiceType::kUnknown : session->serviceType();
  reply(std::nullopt, serviceType);
  kServiceLog.notice("returning service type ", number(serviceType), " for reporter  ",
                     number(reporterID));
}

void HVReportingClientServerInstance::carryOutSetConfiguration(
    const platform::Dictionary& configuration, ReporterID reporterID, const BoolReply& reply) {
  kServiceLog.debug("setting configuration");
  const Session session = findReportingSessionForID(reporterID, Lookup::kOwnSessions);
  // Unlike setServiceType(), this accepts ID 0 if the client has created a session under it. This
  // is required.
  if (session != nullptr) session->updateConfigurationWithContentsOfConfiguration(configuration);
  reply(std::nullopt, true);
}

void HVReportingClientServerInstance::carryOutStart(ReporterID reporterID, const BoolReply& reply) {
  kServiceLog.debug("starting session for reporter ", number(reporterID));
  emitTracePoint(ReportingTracePoint::kStartRequest);
  const Session session = findReportingSessionForID(reporterID, Lookup::kOwnSessions);
  if (reporterID == kNoReporterID || session == nullptr || session->started()) {
    reply(std::nullopt, true);
    return;
  }
  begin(session, delegate_.lock(), reply);
}

void HVReportingClientServerInstance::begin(const Session& session, const Delegate& delegate,
                                            const BoolReply& reply) {
  // The counter is incremented before it is read: the fifth session gets the link, the sixth does
  // not.
  addToActiveSessionCount(delegate, 1);
  session->setTlmReportingEnabled(mayUseLink(delegate));
  session->start();
  note(session, SessionChange::kStarted, delegate);
  // Taken after the start: the driver report covers only what the drivers count from here on.
  if (delegate != nullptr) session->setDriverSnapShot(delegate->getSnapShot());
  deliverHeldReply(*session, *counters_);
  counters_->startReplies.heldBack.add();
  session->setTransactionCompleteBlock(reply);
  sendFeaturesState(*session, delegate);
  // A test gets its reply at once. The reply also stays stored, and is called again when the
  // session is stopped; this is required.
  if (isTracingTest(*session)) reply(std::nullopt, true);
  logActiveSessions(delegate);
}

void HVReportingClientServerInstance::carryOutStop(ReporterID reporterID, const BoolReply& reply) {
  kServiceLog.debug("stopping session for reporter ", number(reporterID));
  emitTracePoint(ReportingTracePoint::kStopRequest);
  if (reporterID == kNoReporterID) {
    reply(std::nullopt, true);
    return;
  }
  const auto answer = [reporterID, reply] {
    kServiceLog.notice("stopping ", number(reporterID));
    reply(std::nullopt, true);
  };
  const Session session = findReportingSessionForID(reporterID, Lookup::kOwnSessions);
  if (session == nullptr || !session->started()) return answer();
  const Delegate delegate = delegate_.lock();
  // The driver messages come first, because only a started session records and forwards them. The
  // snapshot is not needed after them. The held reply of the start precedes the reply to this stop.
  if (delegate != nullptr) delegate->sendDriverLogsForSession(session);
  session->setDriverSnapShot(std::nullopt);
  const auto finished = [this, session, answer] {
    deliverHeldReply(*session, *counters_);
    logActiveSessions(delegate_.lock());
    answer();
  };
  const bool isComplete = stop(session, finished);
  note(session, SessionChange::kStopped, delegate);
  addToActiveSessionCount(delegate, -1);
  if (isComplete) finished();
}

void HVReportingClientServerInstance::carryOutDestroy(ReporterID reporterID,
                                                      const BoolReply& reply) {
  kServiceLog.debug("destroying session for reporter ", number(reporterID));
  emitTracePoint(ReportingTracePoint::kDestroyRequest);
  if (reporterID == kNoReporterID) {
    reply(std::nullopt, true);
    return;
  }
  // Unlike a stop, this sends no driver logs, does not change the counter of active sessions, and
  // drops the held reply of the start. All three are required.
  const auto answer = [reporterID, reply] {
    kServiceLog.notice("destroying ", number(reporterID));
    reply(std::nullopt, true);
  };
  const auto own = sessions_.find(reporterID);
  if (own == sessions_.end()) return answer();
  Session session = own->second;
  const bool isComplete = !session->started() || stop(session, [session, answer]() mutable {
    session.reset();
    answer();
  });
  // Removed at once, even if the file is still being written: other clients must not observe how
  // long it takes.
  removeSession(own, delegate_.lock());
  if (!isComplete) return;
  session.reset();  // the last reference; a session is released before the line is logged
  answer();
}

void HVReportingClientServerInstance::carryOutReporterIDValid(ReporterID reporterID,
                                                              const DictionaryReply& reply) const {
  kServiceLog.debug("validating reporter ", number(reporterID));
  platform::Dictionary result{{"reporterID", std::int64_t{0}},
                              {"serviceType", number(AudioServiceType::kUnknown)}};
  const Session session = findReportingSessionForID(reporterID, Lookup::kAcrossAllClients);
  if (session != nullptr) {
    result.set("reporterID", number(reporterID));
    result.set("serviceType", number(session->serviceType()));
  }
  // The same text is logged twice, at two levels; tools match both lines.
  kServiceLog.notice("validating reporter ", number(reporterID));
  reply(std::nullopt, result);
}

// Lists sessions that are not started, too. This is the only request that logs nothing. Both are
// required.
void HVReportingClientServerInstance::carryOutGetAllReporters(const ReportersReply& reply) const {
  std::vector<ReporterID> reporters;
  if (const Delegate delegate = delegate_.lock()) {
    for (const auto& client : delegate->getAllClients()) {
      for (const auto& [reporterID, session] : client->clientReportingSessionMap()) {
        reporters.push_back(reporterID);
      }
    }
  }
  reply(std::nullopt, reporters);
}

}  // namespace halvox
