#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>

#include "backends/HVReportingVocabulary.h"
#include "platform/dispatch.h"
#include "platform/tlm_reporting.h"
#include "platform/value.h"
#include "session/Guarded.h"
#include "session/ResourceAccount.h"
#include "session/SessionCounters.h"

namespace halvox {

class HVReportingSession;
class SessionProfile;
struct LinkStart;

// What a message says.
struct LinkContent {
  platform::Message original{};  // as the client gave it
  platform::Dictionary tagged{};
};

// The content of a message that is made only when the message is sent, if it is sent.
struct LateContent {
  // Long: `make` takes more than a millisecond, and much memory. In the whole process, one such
  // content at a time is made and sent.
  enum class Length : std::uint8_t { kShort, kLong };

  std::function<LinkContent()> make;
  std::size_t memorySize = 0;  // of what `make` keeps until then, in bytes
  Length length = Length::kShort;
};

// A message on its way to the link.
struct LinkMessage {
  LinkContent content{};
  std::optional<LateContent> late{};  // instead of `content`; only for a message of a run
  AudioEventCategory category{};
  AudioEventType type{};
  bool wasStarted = false;  // at the moment of sending
  bool isRedundant = false;
  std::shared_ptr<ResourceAccount> sender{};  // charged while the message waits; null: nobody
};

// The real-time link of one session: its framework session, from the discovery of back-ends to the
// last flush.
//
//   idle --start job--> configuring --back-ends found--> open --stop job: flush--> idle
//                            |
//                            '--none found, or no answer within 9 seconds--> idle
//
// Messages that were sent during a run reach the framework only while the link is open; otherwise
// they are dropped and counted. Messages that were sent outside a run become single messages. Test
// sessions never reach the framework. Failures are logged and counted, and nothing is retried.
//
// Owned by the session. All work with the framework runs on the link's own serial queue, in the
// order of submission: messages wait until the discovery has ended, and the flush comes after all
// messages. Any thread may call. The submitting operations return at once; each job holds `owner`,
// the session.
class SessionLink {
 public:
  using Owner = std::shared_ptr<const HVReportingSession>;

  // Reads `profile` in its jobs, charges waiting starts and stops to the account of `held`, and
  // counts in `counters`; all three must outlive the link.
  SessionLink(const SessionProfile& profile, const ResourceTally& held,
              const SessionCounters& counters)
      : profile_(profile), held_(held), counters_(counters) {}
  SessionLink(const SessionLink&) = delete;
  SessionLink& operator=(const SessionLink&) = delete;
  ~SessionLink() = default;

  // Opens the link with the session's current type and configuration.
  void submitStart(const Owner& owner);
  // Sends a message through the link, or as a single message if it was sent outside a run.
  void submit(const Owner& owner, LinkMessage message);
  // Sends the message like submit(), but at once and on the calling thread, if nothing waits in the
  // queue and the framework only notes messages. Otherwise does nothing and returns false; the
  // caller then calls submit(). The order of messages stays the same. As a job of the pool, a
  // message takes 1,865 instructions instead of 450 even without a link. When messages are rare,
  // the job also costs another change of threads. The message must not have a long late content.
  [[nodiscard]] bool trySend(const LinkMessage& message);
  // Flushes what the framework still holds and closes the link.
  void submitStop(const Owner& owner);

  // Both are created on the first call, because most sessions of a busy service have no link.
  [[nodiscard]] const std::shared_ptr<platform::DispatchQueue>& tlmReportingQueue();
  // Receives one signal for each answer of the framework about back-ends.
  [[nodiscard]] const std::shared_ptr<platform::DispatchSemaphore>& tlmreportingBackendSemaphore();
  // The framework's session and its token; null unless the link is configuring or open.
  [[nodiscard]] platform::TLMReportingService::Session tlmReportingSession() const {
    return tlmReportingSession_.copy();
  }
  [[nodiscard]] platform::TLMReportingService::Token tlmReportingAgentToken() const {
    return tlmReportingAgentToken_.copy();
  }
  // Whether the framework found back-ends. An answer after the time-out sets it too, although there
  // is no framework session then.
  [[nodiscard]] bool tlmReportingSessionStarted() const {
    return tlmReportingSessionStarted_.load(std::memory_order_acquire);
  }
  // The flag itself, which lives as long as the link. Only tests watch it.
  [[nodiscard]] const std::atomic<bool>* getTLMReportingStartedState() const {
    return &tlmReportingSessionStarted_;
  }

 private:
  // This link, kept alive by its session.
  [[nodiscard]] std::shared_ptr<SessionLink> heldBy(const Owner& owner);
  // Except for onBackendsFound(), these run on the link's queue.
  void start(const Owner& owner, const LinkStart& atStart);
  void endStart(platform::WaitOutcome outcome);
  void stop(const Owner& owner);
  void endStop();
  // Forgets the framework's session; the link sends nothing from then on.
  void drop();
  void handle(const LinkMessage& message);
  void handleInTurn(const Owner& owner, const LinkMessage& message, const ResourceCharge& charge);
  void sendThroughFramework(const LinkMessage& message);
  void sendContent(const platform::TLMReportingService::Session& open, const LinkMessage& message,
                   const LinkContent& content);
  void sendAsSingleMessage(const LinkMessage& message) const;
  // Runs on the framework's thread or on the discovery's queue.
  void onBackendsFound(bool found);

  const SessionProfile& profile_;    // the session's
  const ResourceTally& held_;        // the session's
  const SessionCounters& counters_;  // held by the session
  // These two are adjacent because each takes half a word and would otherwise be padded to a whole
  // one: a service may have 10,000 sessions.
  std::once_flag queueMade_;
  std::once_flag backendSemaphoreMade_;
  std::shared_ptr<platform::DispatchQueue> queue_;
  std::shared_ptr<platform::DispatchSemaphore> backendSemaphore_;
  Guarded<platform::TLMReportingService::Session> tlmReportingSession_;
  Guarded<platform::TLMReportingService::Token> tlmReportingAgentToken_;
  // The framework's thread sets it before it signals the semaphore; orders nothing else.
  std::atomic<bool> tlmReportingSessionStarted_{false};
};

}  // namespace halvox
