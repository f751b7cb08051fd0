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
#include "platform/linux/link/nats/OutgoingMessage.h"
#include "platform/linux/link/nats/OutgoingQueue.h"
#include "platform/linux/link/nats/PendingAcks.h"

namespace halvox::platform::linux_ {

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
// With a spool, nothing is abandoned. What has no acknowledgement in time goes back to the spool
// and is published again later, over this or another connection or by the next run of the service.
// The stream recognises the second copy for two minutes; after a longer outage, it can store a
// message twice whose acknowledgement was lost.
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

  // `wake` makes the link's thread look for work again. `spool` may be null.
  NatsPublisher(const Configuration::Link& options, StatisticsService& statistics, LinkSpool* spool,
                std::function<void()> wake);
  NatsPublisher(const NatsPublisher&) = delete;
  NatsPublisher& operator=(const NatsPublisher&) = delete;
  ~NatsPublisher() = default;

  // Counts a message that a session sends. Call it before the message is queued or refused.
  void countReceived() { received_.add(); }
  // Any thread, without any lock. Returns true if messages are kept while no server is there.
  [[nodiscard]] bool canKeep() const { return spool_ != nullptr && spool_->canKeep(); }
  // Goes on with the messages that an earlier run has kept; see OutgoingQueue.
  void resume(std::function<void()> stored) HALVOX_EXCLUDES(mutex_);
  // Call it when a server was connected or lost.
  void setOnline(bool isOnline) HALVOX_EXCLUDES(mutex_);
  // Queues the message and moves from it. If the queue is full or the link has ended, returns the
  // error and leaves `message` unchanged. Waits if the message goes into the spool while the
  // store's queue is full.
  [[nodiscard]] std::optional<Error> take(OutgoingMessage& message) HALVOX_EXCLUDES(mutex_);
  // Counts a message that was not queued. Its sender gets the error from the caller.
  void refuse(const OutgoingMessage& message);
  // After this call, the last pending acknowledgement also calls `wake`. Without this call it does
  // not, because with little traffic every acknowledgement is the last pending one and would wake
  // the thread for nothing.
  void beginEnd() HALVOX_EXCLUDES(mutex_);
  // Abandons all queued and all unacknowledged messages, or gives them back to the spool. Refuses
  // further ones.
  void abandonAll() HALVOX_EXCLUDES(mutex_);

  // Returns true if a message waits here or in the spool.
  [[nodiscard]] bool hasUnsent() HALVOX_EXCLUDES(mutex_);
  // Returns true if no message can be published now or waits for its acknowledgement.
  [[nodiscard]] bool isDone() HALVOX_EXCLUDES(mutex_);
  // Returns the time when the oldest unacknowledged message will be abandoned; std::nullopt if
  // there is none.
  [[nodiscard]] std::optional<Time> firstDeadline() HALVOX_EXCLUDES(mutex_);
  // Returns the time when the next probe is due; std::nullopt unless the publisher is holding.
  [[nodiscard]] std::optional<Time> probeTime() HALVOX_EXCLUDES(mutex_);
  // Returns true if publishNext() would publish now, provided that a server is connected.
  [[nodiscard]] bool canPublish(Time now) HALVOX_EXCLUDES(mutex_);

  // Returns when keep() is due; std::nullopt if nothing must be kept.
  [[nodiscard]] std::optional<Time> keepTime() HALVOX_EXCLUDES(mutex_);
  // Returns true if refill() would read from the spool now, provided that a server is connected.
  [[nodiscard]] bool mustRefill(Time now) HALVOX_EXCLUDES(mutex_);
  // Returns when the next read after a failed one is due; std::nullopt if none failed.
  [[nodiscard]] std::optional<Time> refillTime() HALVOX_EXCLUDES(mutex_);

  // The functions from here to detach() are for the link's thread only.
  // Moves queued messages and copies of the published ones into the spool.
  void keep() HALVOX_EXCLUDES(mutex_);
  // Reads the next messages from the spool.
  void refill() HALVOX_EXCLUDES(mutex_);
  // Publishes over `context` until detach(). The caller owns `context`. `duplicates` is the time
  // for which the stream recognises identifiers.
  void attach(jsCtx* context, std::chrono::nanoseconds duplicates);
  void publishNext() HALVOX_EXCLUDES(mutex_);
  void abandonOverdue() HALVOX_EXCLUDES(mutex_);
  // Without a spool, counts all queued messages as failed, for example because no server could be
  // reached. Otherwise they stay.
  void failQueued(std::string_view reason) HALVOX_EXCLUDES(mutex_);
  // Call it when the connection has ended, before it is destroyed. Abandons all unacknowledged
  // messages, or gives them back to the spool. Queued messages stay for the next connection.
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
  void returnPending(std::string_view reason) HALVOX_EXCLUDES(mutex_);
  static void resolveKept(const OutgoingQueue::Kept& kept);

  const Configuration::Link& options_;  // owned by the NatsLink
  StatisticsService& statistics_;
  LinkSpool* const spool_;
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
  bool hasEnded_ HALVOX_GUARDED_BY(mutex_) = false;
  OutgoingQueue queue_ HALVOX_GUARDED_BY(mutex_);
  PendingAcks pending_ HALVOX_GUARDED_BY(mutex_){AckWindow{}};
  BurstLog failureLog_ HALVOX_GUARDED_BY(mutex_);
  BurstLog holdLog_ HALVOX_GUARDED_BY(mutex_);

  // Used by the link's thread only.
  jsCtx* context_ = nullptr;
  std::chrono::nanoseconds ackTime_ = kAckTime;
  Time nextStreamCheck_{};
  BurstLog streamLog_;
  BurstLog readLog_;
};

}  // namespace halvox::platform::linux_
