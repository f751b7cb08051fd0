#include <atomic>
#include <chrono>
#include <string>
#include <utility>

#include "backends/HVReportingUtility.h"
#include "platform/services.h"
#include "platform/statistics.h"
#include "platform/tlm_reporting.h"
#include "session/HVReportingSession.h"
#include "session/LinkInfo.h"
#include "session/LinkLog.h"
#include "session/SessionLog.h"

// The session's real-time link. All work with the framework runs on the session's own queue: the
// start job, one job a message, the stop job, in the order of their submission.
namespace halvox {
namespace {

using platform::Dictionary;
using platform::JobWeight;
using platform::Value;
using platform::WaitOutcome;

constexpr std::string_view kQueueLabel = "com.tarno.halvox.session.tlmreporting";
constexpr std::string_view kDiscoveryQueueLabel = "com.tarno.halvox.session.discovery";
constexpr std::chrono::seconds kBackendTimeOut{9};
// What a waiting message costs beside its content, about: the job and its place in the queue.
constexpr std::size_t kWaitingOverhead = 256;

// received = sent + failed + single + suppressed + dropped + those that wait in the queues.
struct LinkCounters {
  platform::Counter& received;
  platform::Counter& sent;
  platform::Counter& failed;
  platform::Counter& single;
  platform::Counter& redundant;
  platform::Counter& notAllowed;
  platform::Counter& testSession;
  platform::Counter& noBackend;
};

const LinkCounters& counters() {
  constexpr std::string_view kPiece = "link";
  platform::StatisticsService& statistics = platform::statistics();
  static const LinkCounters made{statistics.counter(kPiece, "received"),
                                 statistics.counter(kPiece, "sent"),
                                 statistics.counter(kPiece, "failed"),
                                 statistics.counter(kPiece, "handed on: single message"),
                                 statistics.counter(kPiece, "suppressed: redundant"),
                                 statistics.counter(kPiece, "dropped: transactions not allowed"),
                                 statistics.counter(kPiece, "dropped: test session"),
                                 statistics.counter(kPiece, "dropped: no back-end")};
  return made;
}

bool mayUseFramework(AudioServiceType serviceType) {
  return HVReportingUtilityAllowSessionTransactions() && serviceType != AudioServiceType::kTest;
}

}  // namespace

// What a session was when it was started.
struct HVReportingSession::LinkStart {
  AudioServiceType serviceType;
  std::string_view serviceName;  // a constant of the vocabulary
  Dictionary configuration;

  [[nodiscard]] Dictionary userInfo() const {
    Dictionary info{
        {platform::kTLMReportingUserInfoClientName, kLinkClientName},
        {platform::kTLMReportingUserInfoServiceName, std::string(serviceName) + "_session"}};
    info.merge(configuration);
    return info;
  }
  [[nodiscard]] Dictionary sessionInfo(ReporterID reporterID,
                                       const platform::TLMSecureHierarchyToken& token) const {
    const bool batch = HVReportingUtilityShouldBatchTLMReportingEventsForServiceType(serviceType);
    Dictionary info{{platform::kTLMReportingSessionInfoClientType, kLinkClientType},
                    {platform::kTLMReportingSessionInfoClientVersion, kHVReportingVersionNumber},
                    {platform::kTLMReportingSessionInfoSessionID, number(reporterID)},
                    {platform::kTLMReportingSessionInfoBatchEvent, batch},
                    {platform::kTLMReportingSessionInfoHierarchyToken, token.text()},
                    {platform::kTLMReportingSessionInfoContainsRealtimeEvents, !batch}};
    if (const Value* bundle = configuration.find("HostApplicationDisplayID")) {
      info.set(platform::kTLMReportingSessionInfoClientBundleID, *bundle);
    }
    return info;
  }
};

// What the framework answers about back-ends, on its way to one start of a session's link. The
// framework may answer while the start job has not yet logged that it waits. Then the answer stays
// here until it has, and goes on from a queue of its own: so the log of a link always reads in the
// order in which one thing follows from another, and neither thread waits for the other.
//
//   await(), then answer(): reported on the framework's thread
//   answer(), then await(): reported by a job of a queue of its own
//
// Shared by the start job and the framework's callback. The framework may call back late or never,
// so this does not hold the session. One that is gone has nobody waiting: then only the log is
// told.
class HVReportingSession::LinkDiscovery {
 public:
  using Backends = std::optional<platform::Array>;

  explicit LinkDiscovery(std::weak_ptr<HVReportingSession> session)
      : session_(std::move(session)) {}

  // The start job has logged that it waits. Once, on the session's queue.
  void await() {
    if (!isSecond()) return;
    platform::dispatch()
        .createSerialQueue(kDiscoveryQueueLabel, platform::QualityOfService::kUtility,
                           platform::QueueThreading::kShared)
        ->async(JobWeight::kBrief, [session = session_, backends = std::move(answered_)] {
          onBackendsFound(session, backends);
        });
  }
  // Once, on the framework's thread.
  void answer(const Backends& backends) {
    answered_ = backends;
    if (isSecond()) onBackendsFound(session_, backends);
  }

 private:
  bool isSecond() { return hasFirst_.exchange(true, std::memory_order_acq_rel); }

  const std::weak_ptr<HVReportingSession> session_;
  Backends answered_;  // the start job's when that is the second
  // Whether one of the two was here. Orders the answer before its use by the start job.
  std::atomic<bool> hasFirst_{false};
};

const std::shared_ptr<platform::DispatchQueue>& HVReportingSession::tlmReportingQueue() {
  std::call_once(tlmReportingQueueMade_, [this] {
    tlmReportingQueue_ = platform::dispatch().createSerialQueue(
        kQueueLabel, platform::QualityOfService::kUtility, platform::QueueThreading::kShared);
  });
  return tlmReportingQueue_;
}

// Made as late as the queue is: most sessions of a busy service have no link.
const std::shared_ptr<platform::DispatchSemaphore>&
HVReportingSession::tlmreportingBackendSemaphore() {
  std::call_once(backendSemaphoreMade_,
                 [this] { backendSemaphore_ = platform::dispatch().createSemaphore(0); });
  return backendSemaphore_;
}

// A start that waits behind slow ones keeps the configuration of its moment, so it is charged as
// messages are: starting and stopping again and again takes no more than a client may hold.
void HVReportingSession::submitLinkStart() {
  LinkStart start{serviceType(), serviceName(), configuration()};
  ResourceCharge charge(account_, kWaitingOverhead + start.configuration.memorySize());
  tlmReportingQueue()->async(JobWeight::kMayBlock,
                             [session = shared_from_this(), start = std::move(start),
                              charge = std::move(charge)] { session->startLink(start); });
}

void HVReportingSession::startLink(const LinkStart& start) {
  kLinkLog.debug("entering tlmreporting -[HVReportingSession start]_block_invoke");
  if (!mayUseFramework(start.serviceType)) return;
  platform::TLMReportingService& framework = platform::tlmReporting();
  const auto token = framework.TLMHierarchyTokenCreate();
  tlmReportingAgentToken_.set(token);
  const auto opened =
      framework.TLMReportingCreateSession(start.sessionInfo(reporterID_, *token), start.userInfo());
  tlmReportingSession_.set(opened);
  const auto discovery = std::make_shared<LinkDiscovery>(weak_from_this());
  framework.TLMReportingStartConfiguration(
      opened, [discovery](const auto& backends) { discovery->answer(backends); });
  kLinkLog.notice("waiting to find backends");
  discovery->await();
  tlmReportingQueue()->waitOn(
      tlmreportingBackendSemaphore(), kBackendTimeOut,
      [session = shared_from_this()](WaitOutcome outcome) { session->endLinkStart(outcome); });
}

// Never on the session's queue.
void HVReportingSession::onBackendsFound(const std::weak_ptr<HVReportingSession>& weakSession,
                                         const std::optional<platform::Array>& backends) {
  if (backends.has_value()) {
    kLinkLog.notice("list of backends ", platform::describe(*backends));
  } else {
    kLinkLog.error("no backends found, this session won't get sent to the server");
  }
  const auto session = weakSession.lock();
  if (session == nullptr) return;
  session->setTlmReportingSessionStarted(backends.has_value());
  session->tlmreportingBackendSemaphore()->signal();
}

// A callback that comes after the time-out leaves its signal in the semaphore and perhaps the flag
// set. Both stay, by intention: the signal lets the next start go on at once.
void HVReportingSession::endLinkStart(WaitOutcome outcome) {
  if (outcome == WaitOutcome::kTimedOut) {
    kLinkLog.notice("timed out waiting for backends");
  } else if (tlmReportingSessionStarted()) {
    kLinkLog.notice("continuing with backends!");
    return;
  } else {
    kLinkLog.notice("failed to find backend");
  }
  dropLink();
}

void HVReportingSession::dropLink() {
  tlmReportingSession_.set(nullptr);
  tlmReportingAgentToken_.set(nullptr);
}

void HVReportingSession::submitLinkStop() {
  tlmReportingQueue()->async(
      JobWeight::kMayBlock,
      [session = shared_from_this(), charge = ResourceCharge(account_, kWaitingOverhead)] {
        session->stopLink();
      });
}

void HVReportingSession::stopLink() {
  kLinkLog.debug("entering tlmreporting -[HVReportingSession stop]_block_invoke");
  if (!mayUseFramework(serviceType())) return;
  const auto open = tlmReportingSession();
  if (open == nullptr) {
    endLinkStop();
    return;
  }
  // A semaphore of its own: the other one counts discoveries. Nothing else of this session's link
  // runs until the framework has let go of its messages, which it promises to do.
  const auto flushed = platform::dispatch().createSemaphore(0);
  platform::tlmReporting().TLMReportingFlushMessages(open, [flushed] { flushed->signal(); });
  tlmReportingQueue()->waitOn(
      flushed, std::nullopt,
      [session = shared_from_this()](WaitOutcome /*outcome*/) { session->endLinkStop(); });
}

void HVReportingSession::endLinkStop() {
  dropLink();
  setTlmReportingSessionStarted(false);
  kLinkLog.debug("stopping and setting session to nil");
}

// Messages wait here while the link is being opened or its servers are slow. What waits is charged
// to the client that sent it, whose further requests are refused at its bound: so nothing that was
// accepted is lost, what the queues hold is bounded by what clients may hold, and the owner of a
// session does not pay for what others send to it.
void HVReportingSession::submitToLink(LinkMessage message) {
  counters().received.add();
  ResourceCharge charge(message.sender, message.sender == nullptr ? 0 : bytesOf(message));
  tlmReportingQueue()->async(
      JobWeight::kMayBlock,
      [session = shared_from_this(), message = std::move(message), charge = std::move(charge)] {
        kSessionLog.debug(
            "entering tlmreporting "
            "-[HVReportingSession sendMessage:category:type:sync:reply:]_block_invoke");
        if (message.wasStarted) {
          session->sendThroughLink(message);
        } else {
          session->sendAsSingleMessage(message);
        }
      });
}

std::size_t HVReportingSession::bytesOf(const LinkMessage& message) {
  std::size_t bytes = kWaitingOverhead + message.tagged.memorySize();
  if (!message.original.has_value()) return bytes;
  // The tagged message shares all values of the original, unless some were replaced in it.
  const bool sharesValues = message.tagged.size() == message.original->size() + 1;
  bytes += sharesValues ? message.original->size() * sizeof(Dictionary::Entry)
                        : message.original->memorySize();
  return bytes;
}

void HVReportingSession::sendThroughLink(const LinkMessage& message) {
  const std::uint16_t category =
      HVReportingUtilityRetrieveTLMReportingCategoryFromCategory(message.category);
  const auto open = tlmReportingSession();
  if (!HVReportingUtilityAllowSessionTransactions()) return counters().notAllowed.add();
  if (serviceType() == AudioServiceType::kTest) return counters().testSession.add();
  if (message.isRedundant) return counters().redundant.add();
  if (open == nullptr || !tlmReportingSessionStarted()) return counters().noBackend.add();

  const platform::TLMReportingOutcome outcome = platform::tlmReporting().TLMReportingSendMessage(
      open, {.category = category, .type = number(message.type), .payload = message.tagged});
  if (outcome.sent) {
    counters().sent.add();
    kSessionLog.debug("TLMReportingAgent ", *open, " : message ", message.original, " : category ",
                      number(message.category), " : type ", number(message.type));
    return;
  }
  counters().failed.add();
  if (outcome.error.has_value()) {
    kSessionLog.error("error sending message ", outcome.error->description);
  }
}

// The type and the configuration count as they are when the job runs.
void HVReportingSession::sendAsSingleMessage(const LinkMessage& message) {
  kSessionLog.debug("session not started, will send as a single message");
  counters().single.add();
  sendSingleMessage(message.tagged, message.category, message.type, serviceType(), configuration(),
                    nullptr, message.sender);
}

}  // namespace halvox
