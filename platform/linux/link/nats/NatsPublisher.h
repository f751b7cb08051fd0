#pragma once

#include <chrono>
#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/linux/base/Mutex.h"
#include "platform/linux/link/nats/AckLedger.h"
#include "platform/linux/link/nats/BurstLog.h"
#include "platform/linux/link/nats/NatsHandles.h"
#include "platform/linux/link/nats/NatsTlmReporting.h"
#include "platform/linux/link/nats/PendingAcks.h"

namespace halvox::platform::linux_ {

// A message that was not passed to the client library yet.
struct OutgoingMessage {
  NatsMessage message;
  std::size_t bytes = 0;              // body and headers
  std::shared_ptr<AckLedger> ledger;  // null when no flush waits for the message
  AckLedger::Number number = 0;
};

// Publishes messages in order over a connection that NatsLink makes and ends. Counts every message:
// received = acknowledged + not acknowledged + failed (by reason) + still waiting.
//
//   flowing --no responders, no acknowledgement, connection lost--> holding
//      ^                                                            |     ^
//      +--- acknowledged --- probing <--- kResendPause later -------+     |
//                               +------------- failed --------------------+
//
//   flowing: messages leave the queue while the acknowledgement window has room.
//   holding: nothing is published.
//   probing: the oldest unacknowledged message was published again, alone. Its acknowledgement
//            lets all later unacknowledged messages follow in order, and then the queue.
//
// Why one probe first: while a cluster elects a leader, it drops some messages and stores others.
// Without the probe, a later message would overtake an earlier one. If the stream already has a
// message that is published again, it recognises the message's identifier, and acknowledges the
// message without storing it twice. This keeps the order of a session's messages even if the stream
// loses its leader. There is one exception: if the leader changes faster than a message travels to
// the server and back, a later message can be stored before an earlier one.
//
// A probe without a response can mean that the stream was deleted or that its server lost its
// files. The publisher then looks for the stream, and creates it again if it does not exist. A
// message without an acknowledgement within kAckTime of its first attempt is abandoned and counted
// as not acknowledged.
//
// Threads: any, except for the functions from attach() to detach(), which are for the link's
// thread. A thread of the library calls onAcknowledged(). Only the link's thread ever waits for a
// server.
// Locks: `wake` may lock the owner, and is called with no lock of this class held. The owner may
// hold its own lock when it calls a function, unless the function is for the link's thread only.
// Owner: NatsLink, which keeps the publisher until the library has ended.
class NatsPublisher {
 public:
  using Time = std::chrono::steady_clock::time_point;

  // Long enough for a cluster to elect a leader, and for most restarts of a server. At most half of
  // the time for which the stream recognises identifiers; see NatsStream.cpp.
  static constexpr std::chrono::seconds kAckTime{30};
  // The pause between two probes. It is short compared with the election of a leader, which takes
  // seconds.
  static constexpr std::chrono::milliseconds kResendPause{100};
  // The pause between two lookups of the stream. A lookup costs a cluster more than a probe.
  static constexpr std::chrono::seconds kStreamCheckPause{2};
  // The bytes that may wait while no server is connected. This is the size of the largest request
  // of a client, and of about 37,000 ordinary messages (886 bytes with headers). With a larger
  // queue, a session would get the error of a broken link later.
  static constexpr std::size_t kQueueBytes = 32U << 20U;

  // `wake` makes the link's thread look for work again.
  NatsPublisher(const Configuration::Link& options, StatisticsService& statistics,
                std::function<void()> wake);
  NatsPublisher(const NatsPublisher&) = delete;
  NatsPublisher& operator=(const NatsPublisher&) = delete;
  ~NatsPublisher() = default;

  // Counts a message that a session sends. Call it before the message is queued or refused.
  void countReceived() { received_.add(); }
  // Queues the message and moves from it. If the queue is full, returns the error and leaves
  // `message` unchanged.
  [[nodiscard]] std::optional<Error> take(OutgoingMessage& message) HALVOX_EXCLUDES(mutex_);
  // Counts a message that was not queued. Its sender gets the error from the caller.
  void refuse(const OutgoingMessage& message);
  // After this call, the last pending acknowledgement also calls `wake`. Without this call it does
  // not, because with little traffic every acknowledgement is the last pending one and would wake
  // the thread for nothing.
  void beginEnd() HALVOX_EXCLUDES(mutex_);
  // Abandons all queued and all unacknowledged messages.
  void abandonAll() HALVOX_EXCLUDES(mutex_);

  [[nodiscard]] bool hasQueued() HALVOX_EXCLUDES(mutex_);
  // Returns true if no message is queued or waits for its acknowledgement.
  [[nodiscard]] bool isDone() HALVOX_EXCLUDES(mutex_);
  // Returns the time when the oldest unacknowledged message will be abandoned; std::nullopt if
  // there is none.
  [[nodiscard]] std::optional<Time> firstDeadline() HALVOX_EXCLUDES(mutex_);
  // Returns the time when the next probe is due; std::nullopt unless the publisher is holding.
  [[nodiscard]] std::optional<Time> probeTime() HALVOX_EXCLUDES(mutex_);
  // Returns true if publishNext() would publish now, provided that a server is connected.
  [[nodiscard]] bool canPublish(Time now) HALVOX_EXCLUDES(mutex_);

  // The functions from here to detach() are for the link's thread only.
  // Publishes over `context` until detach(). The caller owns `context`. `duplicates` is the time
  // for which the stream recognises identifiers.
  void attach(jsCtx* context, std::chrono::nanoseconds duplicates);
  void publishNext() HALVOX_EXCLUDES(mutex_);
  void abandonOverdue() HALVOX_EXCLUDES(mutex_);
  // Counts all queued messages as failed, for example because no server could be reached.
  void failQueued(std::string_view reason) HALVOX_EXCLUDES(mutex_);
  // Call it when the connection has ended. Abandons all unacknowledged messages. Queued messages
  // stay for the next connection.
  void detach() HALVOX_EXCLUDES(mutex_);

  // Any thread. Call it when the connection was lost. Unacknowledged messages will then be
  // published again, before new ones.
  void holdAfterLoss() HALVOX_EXCLUDES(mutex_);
  // The library calls this function for each acknowledgement. `publisher` points to this object.
  static void onAcknowledged(jsCtx* context, natsMsg* message, jsPubAck* ack, jsPubAckErr* error,
                             void* publisher);

 private:
  enum class Flow : std::uint8_t { kFlowing, kHolding, kProbing };
  enum class Step : std::uint8_t { kWait, kProbe, kSend };

  Step nextStep(Time now) HALVOX_REQUIRES(mutex_);
  void publishSome() HALVOX_EXCLUDES(mutex_);
  void probe() HALVOX_EXCLUDES(mutex_);
  void provideStreamAgain() HALVOX_EXCLUDES(mutex_);
  void reclaim() HALVOX_EXCLUDES(mutex_);
  std::vector<NatsMessage> takeSome() HALVOX_REQUIRES(mutex_);
  void publish(std::vector<NatsMessage> messages, std::chrono::milliseconds patience)
      HALVOX_EXCLUDES(mutex_);
  void hold(std::span<NatsMessage> messages, natsStatus status) HALVOX_EXCLUDES(mutex_);
  void beginHolding(Time until) HALVOX_REQUIRES(mutex_);
  void resolve(NatsMessage message, const jsPubAckErr* error) HALVOX_EXCLUDES(mutex_);
  void settle(const PendingAcks::Entry& entry, const jsPubAckErr* error) HALVOX_EXCLUDES(mutex_);
  void countFailure(std::uint64_t messages, std::string_view reason) HALVOX_EXCLUDES(mutex_);
  void abandon(const std::vector<PendingAcks::Entry>& entries, std::string_view reason)
      HALVOX_EXCLUDES(mutex_);
  void fail(const std::deque<OutgoingMessage>& messages, std::string_view reason)
      HALVOX_EXCLUDES(mutex_);
  [[nodiscard]] std::deque<OutgoingMessage> takeQueue() HALVOX_REQUIRES(mutex_);

  const Configuration::Link& options_;  // owned by the NatsLink
  StatisticsService& statistics_;
  const std::function<void()> wake_;
  Counter& received_;
  Counter& acknowledged_;
  Counter& notAcknowledged_;
  Counter& publishedAgain_;  // attempts, not messages

  Mutex mutex_;
  Flow flow_ HALVOX_GUARDED_BY(mutex_) = Flow::kFlowing;
  Time probeAt_ HALVOX_GUARDED_BY(mutex_){};  // used while holding
  bool isWindowFull_ HALVOX_GUARDED_BY(mutex_) = false;
  bool isStreamInDoubt_ HALVOX_GUARDED_BY(mutex_) = false;
  bool isEnding_ HALVOX_GUARDED_BY(mutex_) = false;
  std::deque<OutgoingMessage> queue_ HALVOX_GUARDED_BY(mutex_);
  std::size_t queuedBytes_ HALVOX_GUARDED_BY(mutex_) = 0;
  PendingAcks pending_ HALVOX_GUARDED_BY(mutex_){AckWindow{}};
  BurstLog failureLog_ HALVOX_GUARDED_BY(mutex_);
  BurstLog holdLog_ HALVOX_GUARDED_BY(mutex_);

  // Used by the link's thread only.
  jsCtx* context_ = nullptr;
  std::chrono::nanoseconds ackTime_ = kAckTime;
  Time nextStreamCheck_{};
  BurstLog streamLog_;
};

// Returns the error for the sender of a message that the link refuses.
[[nodiscard]] Error refusedByLink(std::string description);

}  // namespace halvox::platform::linux_
