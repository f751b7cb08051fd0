#pragma once

#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <thread>
#include <vector>

#include "platform/linux/base/Mutex.h"
#include "platform/linux/link/nats/BurstLog.h"
#include "platform/linux/link/nats/NatsHandles.h"
#include "platform/linux/link/nats/NatsPublisher.h"
#include "platform/linux/link/nats/NatsTlmReporting.h"

namespace halvox::platform::linux_ {

// The one connection to the servers, which all sessions share, and its thread. Only this thread may
// wait for a server: it connects, finds the stream, and runs the publisher. Callers only add
// messages to a queue.
//
//   idle --first need--> connecting --> away <--> connected
//     ^                       |           \          /
//     +------- failed --------+            \        /
//     +----------------------------------- lost ---+
//
//   away: the library has a connection object without a server, and reconnects without end.
//   lost: the library has closed the connection, for example because a server refused our
//         credentials. The thread drops the object; the next attempt makes a new one.
//
// There is at most one attempt to connect at a time. All callers of discover() wait for it, but no
// longer than kDiscoveryTime. After a failed attempt, the next one begins only when a session needs
// a server, and not before kAttemptPause has passed. An idle service without servers therefore
// causes no wake-ups.
//
// With a spool, callers of discover() do not wait: their messages are kept until a server has them.
// While messages wait, attempts go on, with pauses that grow to kLongestPause.
//
// An attempt cannot be cancelled, because the library holds the lock of its connection object
// during the attempt. An attempt may never end, because the library sets no time limit for a TLS
// handshake. close() therefore waits only for a bounded time. If the thread still hangs then,
// close() abandons all messages and does not wait for the thread any longer.
//
// Threads: all public functions may be called by any thread; only close() blocks. Locks: this
// class's lock first, then the publisher's, never the other way round.
// Owner: NatsTlmReportingService. Delayed jobs of discover() hold a weak reference.
class NatsLink : public std::enable_shared_from_this<NatsLink> {
 public:
  // How long a caller of discover() waits at most: less than the 9 seconds that a session waits for
  // its back-ends.
  static constexpr std::chrono::seconds kDiscoveryTime{8};
  // The pause after a failed attempt. Bounds the load on the network when many sessions start while
  // no server answers.
  static constexpr std::chrono::seconds kAttemptPause{1};
  static constexpr std::chrono::seconds kLongestPause{30};
  // How long close() waits for acknowledgements. Slow machines need more than one second.
  static constexpr std::chrono::seconds kCloseTime{3};
  // How long close() waits for an attempt that has begun. An attempt that takes longer usually
  // hangs.
  static constexpr std::chrono::milliseconds kAttemptEndTime{500};
  // How long close() waits for the end of a connection: longer than the library's limits for the
  // drain and for a write together.
  static constexpr std::chrono::seconds kConnectionEndTime{5};

  NatsLink(Configuration::Link options, const NatsEnvironment& environment);
  NatsLink(const NatsLink&) = delete;
  NatsLink& operator=(const NatsLink&) = delete;
  ~NatsLink();  // calls close(), if the owner did not

  // Begins to send what earlier runs have kept in the spool. Call it once, before all others.
  void resume() HALVOX_EXCLUDES(mutex_);
  // Calls `found` exactly once, and never before discover() returns. If messages can be kept, calls
  // it at once on the background queue, with the configured servers. If a server is or gets
  // connected, calls `found` with the servers' addresses on the link's thread. After a failed
  // attempt, calls it with std::nullopt on that thread. After kDiscoveryTime, calls it with
  // std::nullopt on the background queue.
  void discover(TLMReportingService::BackendsCallback found) HALVOX_EXCLUDES(mutex_);
  // After close(), counts a message as refused and returns the error for its sender. Before
  // close(), returns std::nullopt. Call it before creating a message, because after close() the
  // library has ended and creating a message would crash.
  [[nodiscard]] std::optional<Error> refuseAtEnd() HALVOX_EXCLUDES(mutex_);
  // Queues the message. Returns an error if the service is ending, the message is larger than the
  // server accepts, or, without a spool, the queue is full or an attempt to connect failed within
  // kAttemptPause. May wait for the store's queue, but never for a server.
  [[nodiscard]] std::optional<Error> send(OutgoingMessage message) HALVOX_EXCLUDES(mutex_);
  // Publishes queued messages for at most kCloseTime, then ends the connection and the library.
  // Returns false if the thread still runs. This object then exists until the process ends, and
  // `environment` must exist as long. Further calls return the same result.
  [[nodiscard]] bool close() HALVOX_EXCLUDES(mutex_);

 private:
  using Time = std::chrono::steady_clock::time_point;
  // A caller that waits for an attempt to connect.
  struct Waiter {
    std::uint64_t id;
    TLMReportingService::BackendsCallback found;
  };
  // A call of discover() that came while a server was connected. The thread only has to call back.
  struct Answer {
    TLMReportingService::BackendsCallback found;
    Array servers;
  };
  enum class State : std::uint8_t { kIdle, kConnecting, kAway, kConnected, kLost };
  enum class Step : std::uint8_t {
    kWait,
    kCallBack,
    kKeep,
    kAnswer,
    kConnect,
    kPublish,
    kRefill,
    kAbandon,
    kDrop,
    kEnd
  };

  // The functions for callers and the loop of the thread (NatsLink.cpp).
  void run() HALVOX_EXCLUDES(mutex_);
  // Returns false after the last step.
  [[nodiscard]] bool perform(Step step) HALVOX_EXCLUDES(mutex_);
  Step nextStep(Time now) HALVOX_REQUIRES(mutex_);
  [[nodiscard]] bool discoverLater(TLMReportingService::BackendsCallback& found)
      HALVOX_EXCLUDES(mutex_);
  Step nextConnectedStep(Time now) HALVOX_REQUIRES(mutex_);
  [[nodiscard]] bool hasConnection() const HALVOX_REQUIRES(mutex_);
  [[nodiscard]] bool isNeeded() HALVOX_REQUIRES(mutex_);
  [[nodiscard]] bool isAtEnd(Time now) HALVOX_REQUIRES(mutex_);
  std::optional<Time> nextTime(Time now) HALVOX_REQUIRES(mutex_);
  void waitForChange(Time now) HALVOX_REQUIRES(mutex_);
  [[nodiscard]] std::string provideThread() HALVOX_REQUIRES(mutex_);
  void wakeThread() HALVOX_REQUIRES(mutex_);
  void keepLater() HALVOX_EXCLUDES(mutex_);
  void end() HALVOX_EXCLUDES(mutex_);
  [[nodiscard]] bool awaitThread() HALVOX_EXCLUDES(mutex_);
  void giveUpRest() HALVOX_EXCLUDES(mutex_);
  void keepForEver();
  void answerWaiters() HALVOX_EXCLUDES(mutex_);
  void callBackAnswers() HALVOX_EXCLUDES(mutex_);
  void expire(std::uint64_t waiter) HALVOX_EXCLUDES(mutex_);
  [[nodiscard]] std::optional<Error> refusal(std::size_t bytes) HALVOX_REQUIRES(mutex_);

  // The functions of the connection (NatsLinkConnection.cpp).
  void connect() HALVOX_EXCLUDES(mutex_);
  void endAttempt(State state) HALVOX_REQUIRES(mutex_);
  void failAttempt(const std::string& failure) HALVOX_EXCLUDES(mutex_);
  [[nodiscard]] std::string open(NatsConnection& connection, JetStreamContext& context);
  [[nodiscard]] natsStatus configure(natsOptions* options);
  void drain() HALVOX_EXCLUDES(mutex_);
  void dropConnection() HALVOX_EXCLUDES(mutex_);
  void onAvailable(natsConnection* connection) HALVOX_EXCLUDES(mutex_);
  void onAway(natsConnection* connection) HALVOX_EXCLUDES(mutex_);
  void onClosed(natsConnection* connection) HALVOX_EXCLUDES(mutex_);

  const Configuration::Link options_;
  DispatchService& dispatch_;
  NatsPublisher publisher_;

  Mutex mutex_;
  Condition changed_;
  bool isIdle_ HALVOX_GUARDED_BY(mutex_) = false;  // the thread waits for a change
  State state_ HALVOX_GUARDED_BY(mutex_) = State::kIdle;
  std::optional<Time> closeBy_ HALVOX_GUARDED_BY(mutex_);  // set by close()
  Time leaveBy_ HALVOX_GUARDED_BY(mutex_){};  // when close() stops waiting for the thread
  bool hasThreadEnded_ HALVOX_GUARDED_BY(mutex_) = false;
  Time nextAttempt_ HALVOX_GUARDED_BY(mutex_){};
  Time lastAttempt_ HALVOX_GUARDED_BY(mutex_){};  // when the last failed attempt ended
  std::chrono::seconds attemptPause_ HALVOX_GUARDED_BY(mutex_) = kAttemptPause;
  bool isKeptLater_ HALVOX_GUARDED_BY(mutex_) = false;      // the job of keepLater() has not run
  bool isAttemptWanted_ HALVOX_GUARDED_BY(mutex_) = false;  // a session looked for servers
  std::string lastFailure_ HALVOX_GUARDED_BY(mutex_);       // empty when the last attempt succeeded
  std::uint64_t lastWaiter_ HALVOX_GUARDED_BY(mutex_) = 0;
  std::vector<Waiter> waiters_ HALVOX_GUARDED_BY(mutex_);
  std::vector<Answer> answers_ HALVOX_GUARDED_BY(mutex_);
  Array servers_ HALVOX_GUARDED_BY(mutex_);
  std::size_t maxPayload_ HALVOX_GUARDED_BY(mutex_) = 0;  // bytes; 0 when not known
  BurstLog attemptLog_ HALVOX_GUARDED_BY(mutex_);

  // Only the link's thread changes these members, under the lock. Threads of the library compare
  // `connection_` with the connection that they report about, because that one may have been
  // dropped.
  NatsConnection connection_;
  JetStreamContext context_;
  std::thread thread_;
};

}  // namespace halvox::platform::linux_
