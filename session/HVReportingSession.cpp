#include "session/HVReportingSession.h"

#include <utility>

#include "backends/HVReportingTallyhubBridge.h"
#include "backends/HVReportingUtility.h"
#include "platform/services.h"
#include "session/SessionLog.h"
#include "session/SingleMessage.h"
#include "session/TracePoints.h"
#include "session/VolumeMessages.h"

namespace halvox {
namespace {

using platform::Dictionary;
using platform::Message;

// The category and type of the summary event have all bits set. These values are required, although
// the vocabulary's tables do not list them. Their texts are "Undefined" and "Unknown".
constexpr AudioEventCategory kSummaryCategory{0xFFFFFFFF};
constexpr AudioEventType kSummaryType = AudioEventType::kUnknown;
// Messages in a summary that takes about a millisecond. Other clients may wait as long as that.
constexpr std::size_t kMostInShortSummary = 2000;

Dictionary taggedMessage(const Message& message, AudioEventCategory category, AudioEventType type) {
  return HVReportingUtilityAddAudioMessageTag(
      HVReportingUtilityRemoveWhiteSpaceFromKeys(message.value_or(Dictionary())), category, type);
}

LateContent contentOf(const std::shared_ptr<const LateSummary>& summary) {
  const auto make = [summary]() -> LinkContent {
    Message event = summary->makeEvent();
    Dictionary tagged = taggedMessage(event, kSummaryCategory, kSummaryType);
    return {.original = std::move(event), .tagged = std::move(tagged)};
  };
  return {.make = make,
          .memorySize = summary->memorySize(),
          .length = summary->size() > kMostInShortSummary ? LateContent::Length::kLong
                                                          : LateContent::Length::kShort};
}

}  // namespace

HVReportingSession::HVReportingSession(ReporterID reporterID, ProcessIdentifiers processIdentifiers,
                                       Counters counters)
    : counters_(std::move(counters)),
      profile_(reporterID, std::move(processIdentifiers), held_),
      history_(reporterID, held_),
      link_(profile_, held_, *counters_),
      tracing_(profile_),
      summary_(profile_, history_) {
  kSessionLog.info("created reporting session for ID: ", number(reporterID));
  emitTracePoint(ReportingTracePoint::kSessionCreated);
}

// Does not stop the session. If a client replaces a started session by a new one with the same ID,
// the old session ends without a report. This is required.
HVReportingSession::~HVReportingSession() {
  emitTracePoint(ReportingTracePoint::kSessionDestroyed);
  kSessionLog.info("deallocing this session ", number(reporterID()));
  if (transactionCompleteBlock_.take()) counters_->startRepliesDropped.add();
}

void HVReportingSession::setConfiguration(const Message& configuration) {
  if (configuration.has_value()) updateConfigurationWithContentsOfConfiguration(*configuration);
}

std::string HVReportingSession::description() const {
  std::string text;
  appendDescription(text);
  return text;
}

// Appends instead of returning a text, because the lines that list all sessions describe many of
// them.
void HVReportingSession::appendDescription(std::string& text) const {
  text += "reporterID=";
  text += std::to_string(number(reporterID()));
  text += ",serviceName=";
  text += serviceName();
  text += ",ownerPid=";
  text += std::to_string(profile_.ownerPid());
  text += ",HostApplicationDisplayID=";
  text += platform::describe(HVReportingUtilityRetrieveAppName(configuration()));
  text += started() ? ",started=1" : ",started=0";
}

// The history is new for every run: a message that repeats one of the previous run is recorded
// again. The link's start job is queued here, before any message of the run. The messages then wait
// in the link's queue until the discovery has ended.
void HVReportingSession::start() {
  kSessionLog.debug("starting session owned by ", number(reporterID()));
  if (started()) {
    kSessionLog.info("", number(reporterID()), " is already started");
    return;
  }
  started_.store(true, std::memory_order_release);
  history_.begin();
  emitTracePoint(ReportingTracePoint::kSessionStarted);
  if (tlmReportingEnabled()) link_.submitStart(shared_from_this());
  tracing_.start(shared_from_this());
}

void HVReportingSession::stop() {
  const auto rest = beginStop();
  if (rest == nullptr) return;
  while (!rest->writePart()) {
  }
  rest->finish();
}

// A started session logs the first line twice. This is required: tools match both.
std::unique_ptr<SessionStop> HVReportingSession::beginStop() {
  kSessionLog.debug("ending session ", number(reporterID()));
  if (!started()) return nullptr;
  kSessionLog.debug("ending session ", number(reporterID()));
  emitTracePoint(ReportingTracePoint::kSessionStopped);
  // This order is required. The volume messages become part of the history first, because the file
  // and the summary event contain them. The file does not contain the summary event.
  sendVolumeMessages();
  const auto run = summary_.takeHistory();
  auto file = run == nullptr ? nullptr : summary_.makeFile(run);
  if (file == nullptr) endStop(run);
  static_cast<void>(history_.end());
  // Cleared last, because the messages that this stop sends count as messages of a started session.
  // If the file remains, other clients must find a stopped session from here on: a message of
  // theirs can be neither in the file nor in the event.
  started_.store(false, std::memory_order_release);
  if (file == nullptr) return nullptr;
  // The history is no longer part of the session's tally.
  ResourceCharge charge(held_.account(), run->memorySize());
  return std::make_unique<SessionStop>(shared_from_this(), run, std::move(file), std::move(charge));
}

void HVReportingSession::endStop(const std::shared_ptr<const LateSummary>& run) {
  if (run != nullptr) sendSummaryEvent(run);
  // Queued after the messages of the run, which must reach the link before its flush.
  if (tlmReportingEnabled()) link_.submitStop(shared_from_this());
  tracing_.stop();
}

// Each volume message goes through the session, which records it, and to the analytics service.
void HVReportingSession::sendVolumeMessages() {
  summary_.sendVolumeMessages([this](const Message& message) {
    sendMessage(message, AudioEventCategory::kVolume, AudioEventType::kSummary, true, nullptr);
    HVReportingTallyhubBridge::handleEvent(message, AudioEventCategory::kVolume,
                                           AudioEventType::kSummary, shared_from_this());
  });
}

// Sends the summary event through the session only. Unlike a volume message, the event does not go
// to the analytics service; this is required.
//
// This does what sendMessage() does, with two differences. The job of the link makes the content of
// a long event, because for a history of millions of messages that takes seconds, in which all
// clients would wait. A short event is sent at once if possible: otherwise, the first events of the
// session's next run would be stored before the summary of this one. The event is not added to the
// history, which nothing reads from here on and which is empty until the end of the stop. The event
// never repeats a message of the history: it has a text that is longer than that of any message
// with the same keys. It counts as recorded even if the disk is full, because it needs no room.
void HVReportingSession::sendSummaryEvent(const std::shared_ptr<const LateSummary>& run) {
  kSessionLog.notice("sending summary event for reporter ", number(reporterID()));
  kSessionLog.debug("sending message for session owned by ", number(reporterID()));
  count(SessionHistory::Outcome::kRecorded);
  emitTracePoint(ReportingTracePoint::kMessageSent);
  if (!tlmReportingEnabled()) return;
  LinkMessage event{.late = contentOf(run),
                    .category = kSummaryCategory,
                    .type = kSummaryType,
                    .wasStarted = true,
                    .sender = held_.account()};
  const bool isShort = event.late->length == LateContent::Length::kShort;
  if (!isShort || !link_.trySend(event)) link_.submit(shared_from_this(), std::move(event));
}

std::vector<Dictionary> HVReportingSession::createVolumeMessages(const MessageHistory& history,
                                                                 double minimumPlaytime) {
  return halvox::createVolumeMessages(history, minimumPlaytime);
}

void HVReportingSession::sendMessage(const Message& message, AudioEventCategory category,
                                     AudioEventType type, const ErrorReply& reply,
                                     const Account& sender) {
  sendMessage(message, category, type, false, reply, sender);
}

void HVReportingSession::sendMessage(const Message& message, AudioEventCategory category,
                                     AudioEventType type, bool /*sync*/, const ErrorReply& reply,
                                     const Account& sender) {
  kSessionLog.debug("sending message for session owned by ", number(reporterID()));
  const Dictionary tagged = taggedMessage(message, category, type);
  const SessionHistory::Outcome outcome = history_.record(category, type, tagged);
  count(outcome);
  emitTracePoint(ReportingTracePoint::kMessageSent);
  // The state is read here and not in the link's job: by the time the job runs, the session may
  // have been stopped or started again. It is read after the message was recorded; this order is
  // required.
  const bool wasStarted = started();
  if (tlmReportingEnabled()) {
    LinkMessage linkMessage{.content = {.original = message, .tagged = tagged},
                            .category = category,
                            .type = type,
                            .wasStarted = wasStarted,
                            .isRedundant = outcome == SessionHistory::Outcome::kRedundant,
                            .sender = sender != nullptr ? sender : held_.account()};
    // A message with a reply is always queued: the sender gets its reply before the link does any
    // work.
    if (reply || !link_.trySend(linkMessage)) {
      link_.submit(shared_from_this(), std::move(linkMessage));
    }
  }
  // The reply neither waits for the link nor reports the link's failures.
  if (reply) reply(std::nullopt);
}

void HVReportingSession::count(SessionHistory::Outcome outcome) const {
  const SessionCounters::Messages& messages = counters_->messages;
  messages.received.add();
  switch (outcome) {
    case SessionHistory::Outcome::kRecorded:
      return messages.recorded.add();
    case SessionHistory::Outcome::kRedundant:
      return messages.redundant.add();
    case SessionHistory::Outcome::kNotStarted:
      return messages.notStarted.add();
    case SessionHistory::Outcome::kNoRoom:
      return messages.noRoom.add();
  }
}

void HVReportingSession::sendSingleMessage(const Message& message, AudioEventCategory category,
                                           AudioEventType type, AudioServiceType serviceType,
                                           const Dictionary& /*userInfo*/, const ErrorReply& reply,
                                           const Account& sender, const SessionCounters& counters) {
  submitSingleMessage({message, category, type, serviceType}, reply, sender, counters.single);
}

}  // namespace halvox
