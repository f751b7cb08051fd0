#include "session/SessionLink.h"

#include <chrono>
#include <string_view>
#include <utility>

#include "backends/HVReportingUtility.h"
#include "platform/services.h"
#include "session/LinkDiscovery.h"
#include "session/LinkInfo.h"
#include "session/LinkLog.h"
#include "session/SessionLog.h"
#include "session/SessionProfile.h"
#include "session/SingleMessage.h"

namespace halvox {
namespace {

using platform::JobWeight;
using platform::WaitOutcome;

constexpr std::string_view kQueueLabel = "com.tarno.halvox.session.tlmreporting";
// The longest time for which messages wait while no back-end has been found. The value is required.
constexpr std::chrono::seconds kBackendTimeOut{9};
// Estimated bytes of a waiting job and its place in the queue, in addition to its content.
constexpr std::size_t kWaitingOverhead = 256;

// A test session never reaches the framework; this is required.
bool mayUseFramework(AudioServiceType serviceType) {
  return HVReportingUtilityAllowSessionTransactions() && serviceType != AudioServiceType::kTest;
}

// What a waiting message keeps in memory.
std::size_t bytesOf(const LinkMessage& message) {
  if (message.late.has_value()) return kWaitingOverhead + message.late->memorySize;
  const auto& [original, tagged] = message.content;
  std::size_t bytes = kWaitingOverhead + tagged.memorySize();
  if (!original.has_value()) return bytes;
  // Normally the tagged message is the original with one more entry in the same block of memory.
  // If keys had blanks or the original had a tag, each has a block of its own, and texts of up to
  // 128 bytes are in both.
  if (tagged.sharedEntries(*original) < original->size()) bytes += original->memorySize();
  return bytes;
}

// A semaphore that has one signal while no long content is being made. It exists while somebody
// holds it, and then belongs to the dispatch service of its holders.
std::shared_ptr<platform::DispatchSemaphore> turnOfLongContents() {
  static Guarded<std::weak_ptr<platform::DispatchSemaphore>> current;
  const auto locked = current.lock();
  auto turn = locked->lock();
  if (turn == nullptr) {
    turn = platform::dispatch().createSemaphore(1);
    *locked = turn;
  }
  return turn;
}

void logBackends(const LinkDiscovery::Backends& backends) {
  if (backends.has_value()) {
    kLinkLog.notice("list of backends ", platform::describe(*backends));
  } else {
    kLinkLog.error("no backends found, this session won't get sent to the server");
  }
}

}  // namespace

std::shared_ptr<SessionLink> SessionLink::heldBy(const Owner& owner) { return {owner, this}; }

const std::shared_ptr<platform::DispatchQueue>& SessionLink::tlmReportingQueue() {
  std::call_once(queueMade_, [this] {
    queue_ = platform::dispatch().createSerialQueue(
        kQueueLabel, platform::QualityOfService::kUtility, platform::QueueThreading::kShared);
  });
  return queue_;
}

const std::shared_ptr<platform::DispatchSemaphore>& SessionLink::tlmreportingBackendSemaphore() {
  std::call_once(backendSemaphoreMade_,
                 [this] { backendSemaphore_ = platform::dispatch().createSemaphore(0); });
  return backendSemaphore_;
}

// A waiting start keeps a copy of the configuration and is charged like a message. Without the
// charge a client that changed, started and stopped one session in a loop, while no server
// answered, made the service hold 1.2 GB within ten seconds.
void SessionLink::submitStart(const Owner& owner) {
  LinkStart atStart{profile_.serviceType(), profile_.serviceName(), profile_.configuration()};
  ResourceCharge charge(held_.account(), kWaitingOverhead + atStart.configuration.memorySize());
  tlmReportingQueue()->async(JobWeight::kMayBlock,
                             [this, owner, atStart = std::move(atStart),
                              charge = std::move(charge)] { start(owner, atStart); });
}

void SessionLink::start(const Owner& owner, const LinkStart& atStart) {
  kLinkLog.debug("entering tlmreporting -[HVReportingSession start]_block_invoke");
  if (!mayUseFramework(atStart.serviceType)) return;
  platform::TLMReportingService& framework = platform::tlmReporting();
  const auto token = framework.TLMHierarchyTokenCreate();
  tlmReportingAgentToken_.set(token);
  const auto opened = framework.TLMReportingCreateSession(
      atStart.sessionInfo(profile_.reporterID(), *token), atStart.userInfo());
  tlmReportingSession_.set(opened);
  // The callback holds the link weakly, because the framework may never answer. If the session no
  // longer exists when the answer comes, the answer is only logged.
  const auto discovery = std::make_shared<LinkDiscovery>(
      [weakLink = std::weak_ptr(heldBy(owner))](const LinkDiscovery::Backends& backends) {
        logBackends(backends);
        if (const auto link = weakLink.lock()) link->onBackendsFound(backends.has_value());
      });
  framework.TLMReportingStartConfiguration(
      opened, [discovery](const auto& backends) { discovery->answer(backends); });
  kLinkLog.notice("waiting to find backends");
  discovery->awaitAnswer();
  tlmReportingQueue()->waitOn(tlmreportingBackendSemaphore(), kBackendTimeOut,
                              [this, owner](WaitOutcome outcome) { endStart(outcome); });
}

void SessionLink::onBackendsFound(bool found) {
  // The flag is set before the signal, because the job that the signal releases reads the flag.
  tlmReportingSessionStarted_.store(found, std::memory_order_release);
  tlmreportingBackendSemaphore()->signal();
}

// An answer after the time-out leaves its signal in the semaphore and may leave the flag set.
// Neither is reset, and this is required: the signal ends the wait of the next start at once.
void SessionLink::endStart(WaitOutcome outcome) {
  if (outcome == WaitOutcome::kTimedOut) {
    kLinkLog.notice("timed out waiting for backends");
  } else if (tlmReportingSessionStarted()) {
    kLinkLog.notice("continuing with backends!");
    return;
  } else {
    kLinkLog.notice("failed to find backend");
  }
  drop();
}

void SessionLink::drop() {
  tlmReportingSession_.set(nullptr);
  tlmReportingAgentToken_.set(nullptr);
}

void SessionLink::submitStop(const Owner& owner) {
  tlmReportingQueue()->async(
      JobWeight::kMayBlock,
      [this, owner, charge = ResourceCharge(held_.account(), kWaitingOverhead)] { stop(owner); });
}

void SessionLink::stop(const Owner& owner) {
  kLinkLog.debug("entering tlmreporting -[HVReportingSession stop]_block_invoke");
  // Tests the current type, while the start tested the type at the moment of the start. A session
  // that became a test meanwhile is neither flushed nor closed; this is required.
  if (!mayUseFramework(profile_.serviceType())) return;
  const auto open = tlmReportingSession();
  if (open == nullptr) {
    endStop();
    return;
  }
  // The flush has a semaphore of its own, because the link's semaphore counts discoveries. The wait
  // has no time-out, because the framework promises to end every flush.
  const auto flushed = platform::dispatch().createSemaphore(0);
  platform::tlmReporting().TLMReportingFlushMessages(open, [flushed] { flushed->signal(); });
  tlmReportingQueue()->waitOn(flushed, std::nullopt,
                              [this, owner](WaitOutcome /*outcome*/) { endStop(); });
}

void SessionLink::endStop() {
  drop();
  tlmReportingSessionStarted_.store(false, std::memory_order_release);
  kLinkLog.debug("stopping and setting session to nil");
}

// A waiting message is charged to the client that sent it, because the owner of the session cannot
// prevent other clients from sending. Nothing is dropped here to save memory. Instead, the sender's
// next requests are refused while its account is over the limit, before they are answered.
void SessionLink::submit(const Owner& owner, LinkMessage message) {
  counters_.link.received.add();
  ResourceCharge charge(message.sender, message.sender == nullptr ? 0 : bytesOf(message));
  tlmReportingQueue()->async(JobWeight::kMayBlock, [this, owner, message = std::move(message),
                                                    charge = std::move(charge)] {
    const bool isLong =
        message.late.has_value() && message.late->length == LateContent::Length::kLong;
    isLong ? handleInTurn(owner, message, charge) : handle(message);
  });
}

// Without turns, two long summaries would hold both threads of the pool, on which the timer of all
// delayed jobs runs, and would take twice the memory. The queue waits for its turn without a
// thread.
void SessionLink::handleInTurn(const Owner& owner, const LinkMessage& message,
                               const ResourceCharge& charge) {
  auto turn = turnOfLongContents();
  tlmReportingQueue()->waitOn(
      turn, std::nullopt, [this, owner, message, charge, turn](WaitOutcome /*outcome*/) {
        // Also ends the turn if making the content throws.
        const std::shared_ptr<void> end(nullptr, [&turn](void*) { turn->signal(); });
        handle(message);
      });
}

bool SessionLink::trySend(const LinkMessage& message) {
  // A single message gains nothing here, because it waits one second anyway.
  if (!message.wasStarted || !platform::tlmReporting().onlyNotesMessages()) return false;
  const platform::QueueEntry entry(*tlmReportingQueue());
  if (!entry) return false;
  counters_.link.received.add();
  handle(message);
  return true;
}

void SessionLink::handle(const LinkMessage& message) {
  kSessionLog.debug(
      "entering tlmreporting "
      "-[HVReportingSession sendMessage:category:type:sync:reply:]_block_invoke");
  if (message.wasStarted) {
    sendThroughFramework(message);
  } else {
    sendAsSingleMessage(message);
  }
}

void SessionLink::sendThroughFramework(const LinkMessage& message) {
  const auto open = tlmReportingSession();
  // The order of these tests decides under which reason a message is counted.
  if (!HVReportingUtilityAllowSessionTransactions()) return counters_.link.notAllowed.add();
  if (profile_.serviceType() == AudioServiceType::kTest) return counters_.link.testSession.add();
  if (message.isRedundant) return counters_.link.redundant.add();
  if (open == nullptr || !tlmReportingSessionStarted()) return counters_.link.noBackend.add();
  if (message.late.has_value()) return sendContent(open, message, message.late->make());
  sendContent(open, message, message.content);
}

void SessionLink::sendContent(const platform::TLMReportingService::Session& open,
                              const LinkMessage& message, const LinkContent& content) {
  const std::uint16_t category =
      HVReportingUtilityRetrieveTLMReportingCategoryFromCategory(message.category);
  const platform::TLMReportingOutcome outcome = platform::tlmReporting().TLMReportingSendMessage(
      open, {.category = category, .type = number(message.type), .payload = content.tagged});
  if (outcome.sent) {
    counters_.link.sent.add();
    // The line shows the message without its tag and the category with its domain, although the
    // framework got the tag but not the domain. All of this is required.
    kSessionLog.debug("TLMReportingAgent ", *open, " : message ", content.original, " : category ",
                      number(message.category), " : type ", number(message.type));
    return;
  }
  counters_.link.failed.add();
  // A failure without an error is only counted; this is required.
  if (!outcome.error.has_value()) return;
  if (const auto more = counters_.link.failureLog->note()) {
    kSessionLog.error("error sending message ", outcome.error->description, *more);
  }
}

// Uses the current service type, not the type at the moment of sending; this is required.
void SessionLink::sendAsSingleMessage(const LinkMessage& message) const {
  kSessionLog.debug("session not started, will send as a single message");
  counters_.link.single.add();
  submitSingleMessage(
      {message.content.tagged, message.category, message.type, profile_.serviceType()}, nullptr,
      message.sender, counters_.single);
}

}  // namespace halvox
