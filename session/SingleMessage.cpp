#include "session/SingleMessage.h"

#include <chrono>
#include <optional>
#include <random>
#include <utility>

#include "backends/HVReportingUtility.h"
#include "platform/dispatch.h"
#include "platform/services.h"
#include "platform/tlm_reporting.h"
#include "session/LinkInfo.h"
#include "session/SessionLog.h"
#include "session/TracePoints.h"

namespace halvox {
namespace {

using platform::Dictionary;

// The delay is required.
constexpr std::chrono::seconds kSingleMessageDelay{1};
constexpr std::int64_t kNoLinkSession = -1;  // the framework's session ID outside any session
constexpr int kMaxAlarmDelta = 59;
// Estimated bytes of a waiting message's job and timer, in addition to its content.
constexpr std::size_t kPendingOverhead = 256;

// Alarms go off on many devices at the same moment, and the delta would spread their messages. It
// is only logged: every message waits exactly one second. This is required.
std::int64_t drawDelta(AudioServiceType serviceType) {
  if (serviceType != AudioServiceType::kAlarms) return 0;
  // Any uniform generator will do, because the number is only logged. One for each thread needs no
  // lock.
  thread_local std::minstd_rand generator{std::random_device{}()};
  return std::uniform_int_distribution<int>(0, kMaxAlarmDelta)(generator);
}

// Sends the message. Returns the framework's error, or none if it sent the message or gave no
// reason.
std::optional<platform::Error> handOver(const SingleMessage& single,
                                        const SessionCounters::SingleMessages& counters) {
  const Dictionary sessionInfo{
      {platform::kTLMReportingSessionInfoClientType, kLinkClientType},
      {platform::kTLMReportingSessionInfoClientVersion, kHVReportingVersionNumber},
      {platform::kTLMReportingSessionInfoSessionID, kNoLinkSession}};
  const Dictionary userInfo{
      {platform::kTLMReportingUserInfoClientName, kLinkClientName},
      {platform::kTLMReportingUserInfoServiceName,
       HVReportingUtilityGenerateServiceNameFromServiceType(single.serviceType)}};
  // A message that a session took has already been cleaned. A message that no session took arrives
  // here as the client sent it.
  const Dictionary payload =
      HVReportingUtilityRemoveWhiteSpaceFromKeys(single.message.value_or(Dictionary()));
  platform::TLMReportingOutcome outcome = platform::tlmReporting().TLMReportingSendOneMessage(
      sessionInfo, userInfo,
      {.category = HVReportingUtilityRetrieveTLMReportingCategoryFromCategory(single.category),
       .type = number(single.type),
       .payload = payload});
  if (outcome.sent) {
    counters.sent.add();
    kSessionLog.debug("message ", single.message, " : category ", number(single.category),
                      " : type ", number(single.type));
    return std::nullopt;
  }
  counters.failed.add();
  if (!outcome.error.has_value()) return std::nullopt;
  if (const auto more = counters.failureLog->note()) {
    kSessionLog.error("sendOneMessageWithSessionInfo ", outcome.error->description, *more);
  }
  return std::move(outcome.error);
}

void sendNow(const SingleMessage& single, const ErrorReply& reply,
             const SessionCounters::SingleMessages& counters) {
  emitTracePoint(ReportingTracePoint::kMessageSent);
  kSessionLog.debug("sending single message");
  std::optional<platform::Error> error;
  if (HVReportingUtilityShouldSendMessage()) {
    error = handOver(single, counters);
  } else {
    counters.sampled.add();
    kSessionLog.info("event sampled ", single.message);
  }
  if (reply) reply(error);
}

}  // namespace

// The number of waiting messages has no bound of its own. A message that arrives here was already
// answered and must not be dropped. A bound of 32 MiB for all clients was tried: 60 messages of 1
// MiB from one client made it drop all 10 messages of another. Now the sender's account bounds
// them: while it is over its limit, the sender's next messages are refused.
void submitSingleMessage(SingleMessage single, ErrorReply reply,
                         const std::shared_ptr<ResourceAccount>& sender,
                         const SessionCounters::SingleMessages& counters) {
  counters.received.add();
  kSessionLog.debug("sending single message after delta ", drawDelta(single.serviceType),
                    " for service ", number(single.serviceType));
  const std::size_t content = single.message.has_value() ? single.message->memorySize() : 0;
  ResourceCharge charge(sender, kPendingOverhead + content);
  // The background pool is small and shared. The job does not hold it up, because the framework
  // never waits for a server.
  platform::dispatch().asyncAfterOnBackgroundQueue(
      kSingleMessageDelay,
      [single = std::move(single), reply = std::move(reply), charge = std::move(charge), counters] {
        sendNow(single, reply, counters);
      });
}

}  // namespace halvox
