#include <chrono>
#include <optional>
#include <random>
#include <utility>

#include "backends/HVReportingUtility.h"
#include "platform/dispatch.h"
#include "platform/services.h"
#include "platform/statistics.h"
#include "platform/tlm_reporting.h"
#include "session/HVReportingSession.h"
#include "session/LinkInfo.h"
#include "session/SessionLog.h"
#include "session/TracePoints.h"

namespace halvox {
namespace {

using platform::Dictionary;

constexpr std::chrono::seconds kSingleMessageDelay{1};
constexpr std::int64_t kNoLinkSession = -1;  // the framework's session ID outside any session
constexpr int kMaxAlarmDelta = 59;
// What a waiting message costs beside its content, about: the job and its timer.
constexpr std::size_t kPendingOverhead = 256;

// received = sent + failed + suppressed + those that wait for their second.
struct SingleMessageCounters {
  platform::Counter& received;
  platform::Counter& sent;
  platform::Counter& failed;
  platform::Counter& sampled;
};

const SingleMessageCounters& counters() {
  constexpr std::string_view kPiece = "single messages";
  platform::StatisticsService& statistics = platform::statistics();
  static const SingleMessageCounters made{
      statistics.counter(kPiece, "received"), statistics.counter(kPiece, "sent"),
      statistics.counter(kPiece, "failed"), statistics.counter(kPiece, "suppressed: sampled")};
  return made;
}

// Alarms go off everywhere at the same moment, hence the idea of spreading their messages. The
// delta is drawn and logged, but by intention it delays nothing.
std::int64_t drawDelta(AudioServiceType serviceType) {
  if (serviceType != AudioServiceType::kAlarms) return 0;
  thread_local std::minstd_rand generator{std::random_device{}()};
  return std::uniform_int_distribution<int>(0, kMaxAlarmDelta)(generator);
}

// One message on its way to the framework.
struct SingleMessage {
  platform::Message message;
  AudioEventCategory category;
  AudioEventType type;
  AudioServiceType serviceType;
};

// Sends the message; the error when there is one to tell.
std::optional<platform::Error> handOver(const SingleMessage& single) {
  const Dictionary sessionInfo{
      {platform::kTLMReportingSessionInfoClientType, kLinkClientType},
      {platform::kTLMReportingSessionInfoClientVersion, kHVReportingVersionNumber},
      {platform::kTLMReportingSessionInfoSessionID, kNoLinkSession}};
  const Dictionary userInfo{
      {platform::kTLMReportingUserInfoClientName, kLinkClientName},
      {platform::kTLMReportingUserInfoServiceName,
       HVReportingUtilityGenerateServiceNameFromServiceType(single.serviceType)}};
  const Dictionary payload =
      HVReportingUtilityRemoveWhiteSpaceFromKeys(single.message.value_or(Dictionary()));
  platform::TLMReportingOutcome outcome = platform::tlmReporting().TLMReportingSendOneMessage(
      sessionInfo, userInfo,
      {.category = HVReportingUtilityRetrieveTLMReportingCategoryFromCategory(single.category),
       .type = number(single.type),
       .payload = payload});
  if (outcome.sent) {
    counters().sent.add();
    kSessionLog.debug("message ", single.message, " : category ", number(single.category),
                      " : type ", number(single.type));
    return std::nullopt;
  }
  counters().failed.add();
  if (outcome.error.has_value()) {
    kSessionLog.error("sendOneMessageWithSessionInfo ", outcome.error->description);
  }
  return std::move(outcome.error);
}

void sendNow(const SingleMessage& single, const ErrorReply& reply) {
  emitTracePoint(ReportingTracePoint::kMessageSent);
  kSessionLog.debug("sending single message");
  std::optional<platform::Error> error;
  if (HVReportingUtilityShouldSendMessage()) {
    error = handOver(single);
  } else {
    counters().sampled.add();
    kSessionLog.info("event sampled ", single.message);
  }
  if (reply) reply(error);
}

}  // namespace

void HVReportingSession::sendSingleMessage(const platform::Message& message,
                                           AudioEventCategory category, AudioEventType type,
                                           AudioServiceType serviceType,
                                           const platform::Dictionary& /*userInfo*/,
                                           const ErrorReply& reply, const Account& sender) {
  counters().received.add();
  kSessionLog.debug("sending single message after delta ", drawDelta(serviceType), " for service ",
                    number(serviceType));
  // Any number of messages may wait: what a client has waiting is bounded by what may be held for
  // it, and its requests are refused at that bound, before they are answered. A bound here could
  // only drop what was answered already, and that of other clients too.
  ResourceCharge charge(sender, kPendingOverhead + (message ? message->memorySize() : 0));
  // The job runs in a small pool that all share, and blocks nobody: the framework waits for no
  // server.
  platform::dispatch().asyncAfterOnBackgroundQueue(
      kSingleMessageDelay, [single = SingleMessage{message, category, type, serviceType}, reply,
                            charge = std::move(charge)] { sendNow(single, reply); });
}

}  // namespace halvox
