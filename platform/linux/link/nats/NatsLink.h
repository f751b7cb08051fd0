#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>
#include <deque>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "platform/linux/base/Mutex.h"
#include "platform/linux/link/nats/AckLedger.h"
#include "platform/linux/link/nats/BurstLog.h"
#include "platform/linux/link/nats/NatsHandles.h"
#include "platform/linux/link/nats/NatsTlmReporting.h"
#include "platform/linux/link/nats/PendingAcks.h"

namespace halvox::platform::linux_ {

// A message that was not given to the client library yet.
struct OutgoingMessage {
  NatsMessage message;
  std::size_t bytes = 0;
  std::shared_ptr<AckLedger> ledger;  // none when nobody flushes
  AckLedger::Number number = 0;
};

// The one connection to the servers that all sessions share, and the one thread that may wait for
// them: it connects, makes the stream and publishes. Callers only queue.
//
//   idle --first need--> connecting --> connected <--> away (the library reconnects for ever)
//     ^                       |             |            |
//     +------- failed --------+--- closed by the library (credentials refused) ---+
//
// Whoever asks for servers waits for the one attempt that is under way, at most kDiscoveryTime.
// After a failed attempt the next one begins kAttemptPause later, and only when somebody asks.
//
// Messages wait in a queue bounded in bytes; when it is full, they are refused with an error. While
// servers are away they wait there and not in the library's buffer, because what was on its way
// when the connection broke has to go first:
//
//   flowing --no responders, no acknowledgement, connection lost--> holding
//      ^                                                            |     ^
//      +--- acknowledged --- probing <--- kResendPause later -------+     |
//                               +------------- failed --------------------+
//
// Holding, nothing is published. Then the oldest message that is not acknowledged is published
// again; once a server confirms it, all others follow in order, and then new ones. The stream knows
// a message that it has by its identifier, and confirms it without storing it twice. So the
// messages of a session keep their order, also when the stream's leader is lost. When nobody takes
// the oldest message, the stream may be gone, deleted or with its server's files: then it is made
// again. A message that is not confirmed within kAckTime of its first attempt is given up, and
// counted as not acknowledged.
//
// Only a stream whose leader changes in less time than a message takes to the server and back can
// take a later message before one that it had no leader for.
//
// The library's own attempts cannot be called off: while it connects it holds its lock, and nothing
// bounds how long a server may take over the handshake of TLS. So close() leaves the thread behind
// when it does not come back soon; everything that it was to deliver is then given up before.
//
// All functions may be called by any thread, and none waits for a server but close().
class NatsLink : public std::enable_shared_from_this<NatsLink> {
 public:
  static constexpr std::chrono::seconds kDiscoveryTime{8};
  static constexpr std::chrono::seconds kAttemptPause{1};
  static constexpr std::chrono::seconds kCloseTime{3};
  static constexpr std::chrono::milliseconds kAttemptEndTime{500};
  // More than the library's own limits for the end of a connection together.
  static constexpr std::chrono::seconds kConnectionEndTime{5};
  static constexpr std::chrono::seconds kAckTime{30};
  static constexpr std::chrono::milliseconds kResendPause{100};
  static constexpr std::chrono::seconds kStreamCheckPause{2};
  static constexpr std::size_t kQueueBytes = 32U << 20U;

  NatsLink(Configuration::Link options, const NatsEnvironment& environment);
  NatsLink(const NatsLink&) = delete;
  NatsLink& operator=(const NatsLink&) = delete;
  // Must be closed.
  ~NatsLink();

  // Calls back once with the servers' addresses, or none: on the thread, also when it is connected
  // already, or on the background queue when the thread does not come to it within kDiscoveryTime.
  void discover(TLMReportingService::BackendsCallback found) HALVOX_EXCLUDES(mutex_);
  // Why no message is taken any more; it must not even be made then, as the library has ended.
  [[nodiscard]] std::optional<Error> refuseAtEnd() HALVOX_EXCLUDES(mutex_);
  // Takes the message, or says why not.
  [[nodiscard]] std::optional<Error> send(OutgoingMessage message) HALVOX_EXCLUDES(mutex_);
  // Lets what was taken go out, at most kCloseTime, then ends the connection and the library. Of an
  // attempt to connect it awaits the end for kAttemptEndTime. False when the thread was left
  // behind: then this object stays, and so must what it was made with.
  [[nodiscard]] bool close() HALVOX_EXCLUDES(mutex_);

 private:
  using Time = std::chrono::steady_clock::time_point;
  struct Waiter {
    std::uint64_t id;
    TLMReportingService::BackendsCallback found;
  };
  // What was known when it was asked for; only the thread has to tell it.
  struct Answer {
    TLMReportingService::BackendsCallback found;
    Array servers;
  };
  enum class Step : std::uint8_t {
    kWait,
    kTell,
    kAnswer,
    kConnect,
    kProbe,
    kSend,
    kGiveUp,
    kDrop,
    kEnd
  };
  enum class Flow : std::uint8_t { kFlowing, kHolding, kProbing };

  // The thread (NatsLink.cpp).
  void run() HALVOX_EXCLUDES(mutex_);
  Step nextStep(Time now) HALVOX_REQUIRES(mutex_);
  [[nodiscard]] bool isAtEnd(Time now) HALVOX_REQUIRES(mutex_);
  Step nextStepConnected(Time now) HALVOX_REQUIRES(mutex_);
  std::optional<Time> nextTime() HALVOX_REQUIRES(mutex_);
  void waitForChange() HALVOX_REQUIRES(mutex_);
  [[nodiscard]] std::string provideThread() HALVOX_REQUIRES(mutex_);
  void wakeThread() HALVOX_REQUIRES(mutex_);
  void end() HALVOX_EXCLUDES(mutex_);
  [[nodiscard]] bool awaitThread() HALVOX_EXCLUDES(mutex_);
  void giveUpRest() HALVOX_EXCLUDES(mutex_);
  void keepForEver();
  void answerWaiters() HALVOX_EXCLUDES(mutex_);
  void tellAnswers() HALVOX_EXCLUDES(mutex_);
  void expire(std::uint64_t waiter) HALVOX_EXCLUDES(mutex_);
  void countRefused();
  // Provides the thread when the message can be taken.
  [[nodiscard]] std::optional<Error> refusal(const OutgoingMessage& message)
      HALVOX_REQUIRES(mutex_);

  // Publishing and what becomes of it (NatsLinkPublishing.cpp).
  void publishSome() HALVOX_EXCLUDES(mutex_);
  void probe() HALVOX_EXCLUDES(mutex_);
  void reclaim() HALVOX_EXCLUDES(mutex_);
  void giveUpOverdue() HALVOX_EXCLUDES(mutex_);
  std::vector<NatsMessage> takeSome() HALVOX_REQUIRES(mutex_);
  void publish(std::vector<NatsMessage> messages, std::chrono::milliseconds patience)
      HALVOX_EXCLUDES(mutex_);
  void hold(std::span<NatsMessage> messages, natsStatus status) HALVOX_EXCLUDES(mutex_);
  void beginHolding(Time until) HALVOX_REQUIRES(mutex_);
  static void onAcknowledged(jsCtx* context, natsMsg* message, jsPubAck* ack, jsPubAckErr* error,
                             void* link);
  void resolve(NatsMessage message, const jsPubAckErr* error) HALVOX_EXCLUDES(mutex_);
  void settle(const PendingAcks::Entry& entry, const jsPubAckErr* error) HALVOX_EXCLUDES(mutex_);
  void countFailure(std::uint64_t messages, std::string_view reason) HALVOX_EXCLUDES(mutex_);
  void abandon(const std::vector<PendingAcks::Entry>& entries, std::string_view reason)
      HALVOX_EXCLUDES(mutex_);
  void fail(const std::deque<OutgoingMessage>& messages, std::string_view reason)
      HALVOX_EXCLUDES(mutex_);

  // The connection (NatsLinkConnection.cpp).
  void connect() HALVOX_EXCLUDES(mutex_);
  void endAttempt() HALVOX_REQUIRES(mutex_);
  [[nodiscard]] std::string open(NatsConnection& connection, JetStreamContext& context);
  [[nodiscard]] natsStatus configure(natsOptions* options);
  [[nodiscard]] natsStatus secure(natsOptions* options);
  [[nodiscard]] std::string provideStream(jsCtx* context);
  void provideStreamAgain() HALVOX_EXCLUDES(mutex_);
  void drain() HALVOX_EXCLUDES(mutex_);
  void dropConnection() HALVOX_EXCLUDES(mutex_);
  void onAvailable(natsConnection* connection) HALVOX_EXCLUDES(mutex_);
  void onAway(natsConnection* connection) HALVOX_EXCLUDES(mutex_);
  void onClosed(natsConnection* connection) HALVOX_EXCLUDES(mutex_);

  const Configuration::Link options_;
  DispatchService& dispatch_;
  StatisticsService& statistics_;
  Counter& received_;
  Counter& acknowledged_;
  Counter& notAcknowledged_;
  Counter& publishedAgain_;  // attempts, not messages

  Mutex mutex_;
  Condition changed_;
  bool isIdle_ HALVOX_GUARDED_BY(mutex_) = false;  // the thread waits for a change
  bool isConnected_ HALVOX_GUARDED_BY(mutex_) = false;
  bool isLost_ HALVOX_GUARDED_BY(mutex_) = false;  // the library gave the connection up
  bool isWindowFull_ HALVOX_GUARDED_BY(mutex_) = false;
  Flow flow_ HALVOX_GUARDED_BY(mutex_) = Flow::kFlowing;
  Time probeAt_ HALVOX_GUARDED_BY(mutex_){};  // while holding
  bool isStreamInDoubt_ HALVOX_GUARDED_BY(mutex_) = false;
  std::optional<Time> closeBy_ HALVOX_GUARDED_BY(mutex_);
  Time leaveBy_ HALVOX_GUARDED_BY(mutex_){};  // when close() leaves the thread behind
  bool isConnecting_ HALVOX_GUARDED_BY(mutex_) = false;
  bool hasThreadEnded_ HALVOX_GUARDED_BY(mutex_) = false;
  Time nextAttempt_ HALVOX_GUARDED_BY(mutex_){};
  std::string lastFailure_ HALVOX_GUARDED_BY(mutex_);  // empty when the last attempt succeeded
  std::uint64_t lastWaiter_ HALVOX_GUARDED_BY(mutex_) = 0;
  std::vector<Waiter> waiters_ HALVOX_GUARDED_BY(mutex_);
  std::vector<Answer> answers_ HALVOX_GUARDED_BY(mutex_);
  Array servers_ HALVOX_GUARDED_BY(mutex_);
  std::deque<OutgoingMessage> queue_ HALVOX_GUARDED_BY(mutex_);
  std::size_t queuedBytes_ HALVOX_GUARDED_BY(mutex_) = 0;
  std::size_t maxPayload_ HALVOX_GUARDED_BY(mutex_) = 0;  // 0 when not known
  PendingAcks pending_ HALVOX_GUARDED_BY(mutex_){AckWindow{}};
  BurstLog failureLog_ HALVOX_GUARDED_BY(mutex_);
  BurstLog attemptLog_ HALVOX_GUARDED_BY(mutex_);
  BurstLog holdLog_ HALVOX_GUARDED_BY(mutex_);

  // How long a message is published again; the thread's alone.
  std::chrono::nanoseconds ackTime_ = kAckTime;
  Time nextStreamCheck_{};  // the thread's alone
  // Changed by the thread alone, under the lock; other threads only compare the connection.
  NatsConnection connection_;
  JetStreamContext context_;
  std::thread thread_;
};

}  // namespace halvox::platform::linux_
