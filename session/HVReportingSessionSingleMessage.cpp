#include <atomic>
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
// What may wait for its second at once, in bytes of messages. A flood past it is dropped.
constexpr std::size_t kMaxPendingBytes = std::size_t{32} * 1024 * 1024;
// What a waiting message costs beside its content, about: the job and its timer.
constexpr std::size_t kPendingOverhead = 256;

// received = sent + failed + suppressed + dropped + those that wait for their second.
struct SingleMessageCounters {
  platform::Counter& received;
  platform::Counter& sent;
  platform::Counter& failed;
  platform::Counter& sampled;
  platform::Counter& tooManyWaiting;
};

const SingleMessageCounters& counters() {
  constexpr std::string_view kPiece = "single messages";
  platform::StatisticsService& statistics = platform::statistics();
  static const SingleMessageCounters made{
      statistics.counter(kPiece, "received"), statistics.counter(kPiece, "sent"),
      statistics.counter(kPiece, "failed"), statistics.counter(kPiece, "suppressed: sampled"),
      statistics.counter(kPiece, "dropped: too many waiting")};
  return made;
}

// The bytes of all single messages that wait for their second. Any thread.
class PendingBytes {
 public:
  // A token that keeps the bytes counted as long as it lives; null when there is no room.
  std::shared_ptr<void> tryAdd(std::size_t bytes) {
    if (bytes_.fetch_add(bytes, std::memory_order_relaxed) + bytes > kMaxPendingBytes) {
      remove(bytes);
      return nullptr;
    }
    return {this, [bytes](PendingBytes* pending) { pending->remove(bytes); }};
  }
  // True for the first refusal since there was room again for many messages.
  bool isNewBurst() { return !inBurst_.exchange(true, std::memory_order_relaxed); }

 private:
  void remove(std::size_t bytes) {
    const std::size_t left = bytes_.fetch_sub(bytes, std::memory_order_relaxed) - bytes;
    if (left < kMaxPendingBytes / 2) inBurst_.store(false, std::memory_order_relaxed);
  }

  // They order with nothing: the bound may be missed by what other threads add at that moment.
  std::atomic<std::size_t> bytes_{0};
  std::atomic<bool> inBurst_{false};
};

PendingBytes& pendingBytes() {
  // Never destroyed: jobs that did not run hold tokens when the process ends.
  static auto* instance = new PendingBytes;
  return *instance;
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

void refuse(const ErrorReply& reply) {
  counters().tooManyWaiting.add();
  if (pendingBytes().isNewBurst()) {
    kSessionLog.error("too many single messages are waiting, dropping some");
  }
  if (reply) reply(platform::Error{.description = "too many single messages are waiting"});
}

}  // namespace

void HVReportingSession::sendSingleMessage(const platform::Message& message,
                                           AudioEventCategory category, AudioEventType type,
                                           AudioServiceType serviceType,
                                           const platform::Dictionary& /*userInfo*/,
                                           const ErrorReply& reply) {
  counters().received.add();
  kSessionLog.debug("sending single message after delta ", drawDelta(serviceType), " for service ",
                    number(serviceType));
  std::shared_ptr<void> place =
      pendingBytes().tryAdd(kPendingOverhead + (message ? message->memorySize() : 0));
  if (place == nullptr) {
    refuse(reply);
    return;
  }
  // The job runs in a small pool that all share, and blocks nobody: the framework waits for no
  // server.
  platform::dispatch().asyncAfterOnBackgroundQueue(
      kSingleMessageDelay, [single = SingleMessage{message, category, type, serviceType}, reply,
                            place = std::move(place)] { sendNow(single, reply); });
}

}  // namespace halvox
