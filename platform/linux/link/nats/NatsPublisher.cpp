#include "platform/linux/link/nats/NatsPublisher.h"

#include <algorithm>
#include <utility>

#include "platform/linux/link/nats/NatsLog.h"
#include "platform/linux/link/nats/NatsStream.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog(natsLogCategory, "NatsLink");

// How many messages the publisher takes from the queue at a time. It takes them under the lock and
// calls the library without the lock, because senders would otherwise wait while the library
// writes.
constexpr std::size_t kMessagesAtOnce = 64;

// If a message is not acknowledged within this time, the attempt to publish it has failed. The time
// is much longer than a busy server needs, and short enough for a second attempt within the 5
// seconds of a flush.
constexpr std::chrono::milliseconds kAttemptTime{3000};
constexpr std::chrono::milliseconds kProbeTime{1000};

// Returns true if another attempt to publish can succeed after this failure.
bool isTemporary(natsStatus status, jsErrCode code = {}) {
  switch (status) {
    case NATS_NO_RESPONDERS:
    case NATS_TIMEOUT:
    case NATS_INSUFFICIENT_BUFFER:
    case NATS_CONNECTION_CLOSED:
    case NATS_CONNECTION_DISCONNECTED:
    case NATS_IO_ERROR:
    case NATS_STALE_CONNECTION:
      return true;
    default:  // the library's statuses are many, and new versions add some
      return code == JSClusterNotAvailErr || code == JSClusterNotLeaderErr;
  }
}

}  // namespace

NatsPublisher::NatsPublisher(const Configuration::Link& options, StatisticsService& statistics,
                             LinkSpool* spool, std::function<void()> wake)
    : options_(options),
      statistics_(statistics),
      spool_(spool),
      wake_(std::move(wake)),
      received_(statistics_.counter(kNatsPiece, "received")),
      acknowledged_(statistics_.counter(kNatsPiece, "acknowledged")),
      notAcknowledged_(statistics_.counter(kNatsPiece, "not acknowledged")),
      publishedAgain_(statistics_.counter(kNatsPiece, "published again")),
      queue_(spool, statistics) {}

void NatsPublisher::beginEnd() {
  const MutexLock lock(mutex_);
  isEnding_ = true;
}

void NatsPublisher::attach(jsCtx* context, std::chrono::nanoseconds duplicates) {
  context_ = context;
  // A stream that someone else created may recognise identifiers for a shorter time than our
  // streams do.
  ackTime_ = std::min<std::chrono::nanoseconds>(kAckTime, duplicates / 2);
}

void NatsPublisher::detach() {
  {
    const MutexLock lock(mutex_);
    // The state of the window and of the flow belongs to one connection. Reset both for the next
    // one.
    isWindowFull_ = false;
    flow_ = Flow::kFlowing;
    isStreamInDoubt_ = false;
  }
  returnPending("the connection ended");
  context_ = nullptr;
}

bool NatsPublisher::isDone() {
  const MutexLock lock(mutex_);
  return !queue_.hasNext() && pending_.size() == 0;
}

std::optional<NatsPublisher::Time> NatsPublisher::firstDeadline() {
  const MutexLock lock(mutex_);
  return pending_.firstDeadline();
}

std::optional<NatsPublisher::Time> NatsPublisher::probeTime() {
  const MutexLock lock(mutex_);
  if (flow_ != Flow::kHolding) return std::nullopt;
  return probeAt_;
}

bool NatsPublisher::canPublish(Time now) {
  const MutexLock lock(mutex_);
  return nextStep(now) != Step::kWait;
}

NatsPublisher::Step NatsPublisher::nextStep(Time now) {
  // After the window was full, wait until half of it is free. Waking the thread for every
  // acknowledgement would cost more than the acknowledgement itself.
  if (isWindowFull_ && pending_.isHalfFree()) isWindowFull_ = false;
  // The purpose of a probe is to keep unacknowledged messages in order. Without such messages,
  // publish without a probe.
  if (pending_.size() == 0) flow_ = Flow::kFlowing;
  if (flow_ == Flow::kProbing) return Step::kWait;
  if (flow_ == Flow::kHolding) return now >= probeAt_ ? Step::kProbe : Step::kWait;
  // Check for messages to publish again before the queue, because new messages must not overtake
  // them.
  if (pending_.needsAgain()) return pending_.hasAgain() ? Step::kSend : Step::kWait;
  return queue_.hasNext() && !isWindowFull_ ? Step::kSend : Step::kWait;
}

// Calls nextStep() again, because an acknowledgement may have arrived since canPublish().
void NatsPublisher::publishNext() {
  Step step = Step::kWait;
  {
    const MutexLock lock(mutex_);
    step = nextStep(std::chrono::steady_clock::now());
  }
  switch (step) {
    case Step::kWait:
      return;
    case Step::kProbe:
      return probe();
    case Step::kSend:
      return publishSome();
  }
}

// Takes some messages to publish. Adds new ones to pending_ before they are published, because an
// acknowledgement can arrive before the call that publishes has returned.
std::vector<NatsMessage> NatsPublisher::takeSome() {
  std::vector<NatsMessage> taken;
  taken.reserve(kMessagesAtOnce);
  while (taken.size() < kMessagesAtOnce && pending_.hasAgain()) {
    taken.push_back(pending_.nextAgain());
  }
  publishedAgain_.add(taken.size());
  const Time now = std::chrono::steady_clock::now();
  const Time deadline =
      now + std::chrono::duration_cast<std::chrono::steady_clock::duration>(ackTime_);
  while (queue_.hasNext() && taken.size() < kMessagesAtOnce && pending_.hasRoom() &&
         !pending_.needsAgain()) {
    OutgoingMessage next = queue_.takeNext();
    pending_.add(next.message.get(), {.ledger = std::move(next.ledger),
                                      .number = next.number,
                                      .bytes = next.bytes,
                                      .published = now,
                                      .deadline = deadline,
                                      .spooled = next.spooled});
    taken.push_back(std::move(next.message));
  }
  isWindowFull_ = !pending_.hasRoom();
  return taken;
}

void NatsPublisher::publishSome() {
  std::vector<NatsMessage> messages;
  {
    const MutexLock lock(mutex_);
    messages = takeSome();
  }
  publish(std::move(messages), kAttemptTime);
}

void NatsPublisher::probe() {
  // Look for the stream first, because without it this probe would fail like the last one.
  provideStreamAgain();
  reclaim();
  std::vector<NatsMessage> messages;
  {
    const MutexLock lock(mutex_);
    pending_.beginAgain();
    if (!pending_.hasAgain()) {  // all are settled, or a callback settles the last one now
      probeAt_ = std::chrono::steady_clock::now() + kResendPause;
      return;
    }
    flow_ = Flow::kProbing;
    messages.push_back(pending_.nextAgain());
  }
  publishedAgain_.add();
  publish(std::move(messages), kProbeTime);
}

// Looks for the stream, and creates it if it was deleted. A failed probe does not show whether the
// stream was deleted or only has no leader. Does not look at every probe; see kStreamCheckPause.
void NatsPublisher::provideStreamAgain() {
  const Time now = std::chrono::steady_clock::now();
  {
    const MutexLock lock(mutex_);
    if (!isStreamInDoubt_ || now < nextStreamCheck_) return;
    isStreamInDoubt_ = false;
  }
  const StreamProvision provision = provideStream(context_, options_);
  nextStreamCheck_ = std::chrono::steady_clock::now() + kStreamCheckPause;
  ackTime_ = std::min<std::chrono::nanoseconds>(kAckTime, provision.duplicates / 2);
  if (provision.failure.empty() || !streamLog_.note(1, now)) return;
  kLog.error("NATS accepts no messages: ", provision.failure, "; messages wait");
}

// Takes back the messages for whose acknowledgements the library still waits, to publish them again
// in order. The library would otherwise report a time-out for each of them separately.
void NatsPublisher::reclaim() {
  natsMsgList list{};
  if (js_PublishAsyncGetPendingList(&list, context_) != NATS_OK) return;
  {
    const MutexLock lock(mutex_);
    for (natsMsg*& message : std::span(list.Msgs, static_cast<std::size_t>(list.Count))) {
      static_cast<void>(pending_.giveBack(NatsMessage(std::exchange(message, nullptr))));
    }
  }
  natsMsgList_Destroy(&list);
}

void NatsPublisher::publish(std::vector<NatsMessage> messages, std::chrono::milliseconds patience) {
  jsPubOptions publishing;
  jsPubOptions_Init(&publishing);
  publishing.MaxWait = patience.count();
  for (std::size_t index = 0; index < messages.size(); ++index) {
    natsMsg* raw = messages[index].release();
    // js_PublishMsgAsync() takes the message and sets `raw` to null, unless it fails.
    natsMsg* const key = raw;
    const natsStatus status = js_PublishMsgAsync(context_, &raw, &publishing);
    if (status == NATS_OK) continue;
    messages[index].reset(raw);
    if (isTemporary(status)) {
      return hold(std::span(messages).subspan(index), status);
    }
    const jsPubAckErr error{.Msg = key, .Err = status, .ErrCode = {}, .ErrText = nullptr};
    resolve(std::move(messages[index]), &error);
  }
}

// Keeps messages for another attempt after their attempt has failed.
void NatsPublisher::hold(std::span<NatsMessage> messages, natsStatus status) {
  std::optional<std::uint64_t> worthALine;
  {
    const MutexLock lock(mutex_);
    bool isKnown = flow_ == Flow::kProbing;
    for (NatsMessage& message : messages) {
      isKnown = pending_.giveBack(std::move(message)) || isKnown;
    }
    // The library reports the failure of each message separately. The first failure begins the
    // pause, and the others must not prolong it.
    if (!isKnown || flow_ == Flow::kHolding) return;
    const Time now = std::chrono::steady_clock::now();
    if (flow_ == Flow::kProbing && status == NATS_NO_RESPONDERS) isStreamInDoubt_ = true;
    beginHolding(now + kResendPause);
    worthALine = holdLog_.note(1, now);
  }
  wake_();
  if (worthALine)
    kLog.notice("NATS did not accept messages (", natsStatus_GetText(status),
                "); publishing them again in order");
}

void NatsPublisher::holdAfterLoss() {
  const MutexLock lock(mutex_);
  beginHolding(std::chrono::steady_clock::now());
}

void NatsPublisher::beginHolding(Time until) {
  if (pending_.size() == 0) return;
  flow_ = Flow::kHolding;
  probeAt_ = until;
}

void NatsPublisher::abandonOverdue() {
  if (spool_ != nullptr) return returnPending("no acknowledgement in time");
  std::vector<PendingAcks::Entry> overdue;
  {
    const MutexLock lock(mutex_);
    overdue = pending_.takeOverdue(std::chrono::steady_clock::now());
  }
  abandon(overdue, "no acknowledgement in time");
}

void NatsPublisher::onAcknowledged(jsCtx*, natsMsg* message, jsPubAck*, jsPubAckErr* error,
                                   void* publisher) {
  NatsMessage owned(message);
  auto& self = *static_cast<NatsPublisher*>(publisher);
  if (error != nullptr && isTemporary(error->Err, error->ErrCode)) {
    return self.hold(std::span(&owned, 1), error->Err);
  }
  self.resolve(std::move(owned), error);
}

void NatsPublisher::resolve(NatsMessage message, const jsPubAckErr* error) {
  std::optional<PendingAcks::Entry> entry;
  bool isAwaited = false;
  {
    const MutexLock lock(mutex_);
    entry = pending_.take(message.get());
    if (entry && entry->spooled != 0) queue_.settle(entry->spooled);
    // Free the message under the lock. When the link's thread sees that nothing is pending, it may
    // end the library, and the message must be destroyed before that.
    message.reset();
    const bool isProbed = flow_ == Flow::kProbing;
    if (isProbed) flow_ = Flow::kFlowing;
    // Most acknowledgements need not wake the thread. Wake it only if it has something to do now.
    isAwaited = isProbed || pending_.needsAgain() || (isWindowFull_ && pending_.isHalfFree()) ||
                (isEnding_ && pending_.size() == 0);
  }
  if (isAwaited) wake_();
  if (entry) settle(*entry, error);  // std::nullopt if the message was abandoned before
}

void NatsPublisher::settle(const PendingAcks::Entry& entry, const jsPubAckErr* error) {
  if (error == nullptr) {
    acknowledged_.add();
  } else {
    const std::string_view reason = natsStatus_GetText(error->Err);
    countFailure(1, error->ErrText != nullptr ? error->ErrText : reason);
    // Look the counter up by name each time, because there are many reasons and failures are rare.
    statistics_.counter(kNatsPiece, std::string("failed: ") + std::string(reason)).add();
  }
  if (!entry.ledger) return;
  entry.ledger->resolve(entry.number,
                        error == nullptr ? AckOutcome::kAcknowledged : AckOutcome::kFailed);
}

void NatsPublisher::countFailure(std::uint64_t messages, std::string_view reason) {
  std::optional<std::uint64_t> worthALine;
  {
    const MutexLock lock(mutex_);
    worthALine = failureLog_.note(messages, std::chrono::steady_clock::now());
  }
  if (worthALine) {
    kLog.error("", *worthALine,
               " messages were not delivered to NATS; reason of the last: ", reason);
  }
}

void NatsPublisher::abandon(const std::vector<PendingAcks::Entry>& entries,
                            std::string_view reason) {
  if (entries.empty()) return;
  notAcknowledged_.add(entries.size());
  countFailure(entries.size(), reason);
  for (const PendingAcks::Entry& entry : entries) {
    if (entry.ledger) entry.ledger->resolve(entry.number, AckOutcome::kFailed);
  }
}

void NatsPublisher::fail(const std::deque<OutgoingMessage>& messages, std::string_view reason) {
  if (messages.empty()) return;
  statistics_.counter(kNatsPiece, std::string("failed: ") + std::string(reason))
      .add(messages.size());
  countFailure(messages.size(), reason);
  for (const OutgoingMessage& message : messages) {
    if (message.ledger) message.ledger->resolve(message.number, AckOutcome::kFailed);
  }
}

}  // namespace halvox::platform::linux_
