#include "backends/HVReportingJoulebookUtility.h"
#include "backends/HVReportingTallyhubBridge.h"
#include "backends/HVReportingZUBBridge.h"
#include "platform/clock.h"
#include "platform/services.h"
#include "service/HVReportingClientServerInstance.h"
#include "service/RoundedSeconds.h"
#include "service/ServiceLog.h"
#include "session/SessionLog.h"
#include "session/TracePoints.h"

// How a client's message reaches the back-ends and the sessions.
namespace halvox {
namespace {

constexpr std::string_view kErrorDomain = "com.tarno.audio.reporting";
constexpr std::int64_t kReportingDisabled = 1;
// The reporter ID of messages that are sent while no session is active.
constexpr ReporterID kStandaloneReporterID{1};

// Describes the reporter IDs of a request for a log line.
class ReporterIDsDescription {
 public:
  explicit ReporterIDsDescription(const std::optional<platform::Array>& reporters)
      : reporters_(reporters) {}
  [[nodiscard]] std::string description() const {
    if (!reporters_.has_value()) return "(null)";
    return ListDescription(*reporters_,
                           [](std::string& text, const platform::Value& reporterID) {
                             text += std::to_string(reporterID.toInt64());
                           })
        .description();
  }

 private:
  const std::optional<platform::Array>& reporters_;  // owned by the request
};

// Adds the time of arrival to the message. Removes what the client sent under these keys first, so
// that the stamps become the last entries. They must be last, because sessions replace blanks in
// keys and keep the later of two equal keys: a client's "systemuptime sec" must not displace a
// stamp.
void stamp(platform::Message& message) {
  static const platform::Key timestamp("hvreporting_timestamp");
  static const platform::Key systemUptime("systemuptime_sec");
  static const platform::Key processUptime("processuptime_ms");
  // The three stamps, and the tag that a session adds.
  constexpr std::size_t kAddedEntries = 4;
  if (!message.has_value()) return;
  const platform::ClockService& clock = platform::clock();
  for (const platform::Key& key : {timestamp, systemUptime, processUptime}) message->remove(key);
  message->reserve(message->size() + kAddedEntries);
  message->add(timestamp, clock.currentDate().secondsSince1970);
  message->add(systemUptime, roundedSeconds(clock.systemUptime()));
  message->add(processUptime, std::int64_t{clock.processUptime().count()});
}

}  // namespace

void HVReportingClientServerInstance::carryOutSend(MessageRequest& request) {
  kServiceLog.debug("sending message for reporter ", ReporterIDsDescription(request.reporterIDs));
  emitTracePoint(ReportingTracePoint::kSendRequest);
  counters_->messages.received.add();
  const Delegate delegate = delegate_.lock();
  if (delegate == nullptr || !delegate->isReportingEnabled()) {
    counters_->messages.disabled.add();
    request.request.answer(
        platform::Error{.domain = std::string(kErrorDomain), .code = kReportingDisabled}, {});
    return;
  }
  stamp(request.message);
  if (request.reporterIDs.has_value()) {
    sendToNamedSessions(request, delegate);
  } else {
    sendToActiveSessions(request, delegate);
  }
  request.request.answer(std::nullopt, {});
}

void HVReportingClientServerInstance::sendToNamedSessions(const MessageRequest& request,
                                                          const Delegate& delegate) const {
  bool delivered = false;
  for (const platform::Value& value : *request.reporterIDs) {
    const auto reporterID = static_cast<ReporterID>(value.toInt64());
    // An unknown ID is skipped silently. A session that is named twice gets the message twice. Both
    // are required.
    if (reporterID == kNoReporterID) continue;
    const Session session = findReportingSessionForID(reporterID, Lookup::kAcrossAllClients);
    if (session == nullptr) continue;
    handToBackEnds(request, session, delegate);
    session->sendMessage(request.message, request.category, request.type, nullptr, account_);
    delivered = true;
  }
  (delivered ? counters_->messages.delivered : counters_->messages.noSession).add();
}

void HVReportingClientServerInstance::sendToActiveSessions(const MessageRequest& request,
                                                           const Delegate& delegate) const {
  const auto sessions = delegate->getAllActiveReportingSessions();
  kServiceLog.notice("active reporting sessions ", sessions.size(), " : ",
                     sessionsDescription(sessions));
  counters_->messages.delivered.add();
  if (sessions.empty()) {
    sendStandalone(request, delegate);
    return;
  }
  // Here the session gets the message before the back-ends; a named session gets it after them.
  // Both orders are required.
  for (const Session& session : sessions) {
    session->sendMessage(request.message, request.category, request.type, nullptr, account_);
    handToBackEnds(request, session, delegate);
  }
}

void HVReportingClientServerInstance::sendStandalone(const MessageRequest& request,
                                                     const Delegate& delegate) const {
  // The back-ends need a session. A message that no session takes gets a temporary session, which
  // is never started and enters no map. The queued payloads hold it until they are built.
  const auto session = std::make_shared<HVReportingSession>(
      kStandaloneReporterID,
      HVReportingSession::ProcessIdentifiers{platform::process().ownProcessIdentifier()},
      counters_->sessions);
  session->setServiceType(AudioServiceType::kStandalone);
  session->updateConfigurationWithContentsOfConfiguration(
      {{"HostApplicationDisplayID", "Unknown"}});
  handToBackEnds(request, session, delegate);
  kServiceLog.notice("no active reporting sessions found, sending as standalone");
  HVReportingSession::sendSingleMessage(request.message, request.category, request.type,
                                        AudioServiceType::kStandalone, delegate->getDefaults(),
                                        nullptr, account_, *counters_->sessions);
}

// The order is required. Each back-end ignores the messages that do not concern it.
void HVReportingClientServerInstance::handToBackEnds(const MessageRequest& request,
                                                     const Session& session,
                                                     const Delegate& delegate) const {
  const auto& [message, category, type, ids, senderName, posted, charge] = request;
  HVReportingTallyhubBridge::handleEvent(message, category, type, session);
  HVReportingJoulebookUtility::handleEvent(message, category, type, session, counters_->powerLog);
  HVReportingZUBBridge::handleEvent(message, category, type, session, counters_->issueMetrics);
  delegate->handleEventForVEK(message, category, type, session, senderName);
}

}  // namespace halvox
