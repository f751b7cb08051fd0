#include <span>
#include <string>
#include <utility>

#include "platform/linux/link/nats/NatsLink.h"
#include "platform/linux/link/nats/NatsLog.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog(natsLogCategory, "NatsLink");

// Messages that are published under one hold of the lock before and none while publishing.
constexpr std::size_t kMessagesAtOnce = 64;

// How long an acknowledgement may take before the message counts as lost on the way: much longer
// than a busy server needs, but short enough to come through within the time of a flush.
constexpr std::chrono::milliseconds kAttemptTime{3000};
constexpr std::chrono::milliseconds kProbeTime{1000};

// Whether another attempt can succeed where this one failed.
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
    default:  // a status of the library, which gains some
      return code == JSClusterNotAvailErr || code == JSClusterNotLeaderErr;
  }
}

}  // namespace

// Their acknowledgements are expected from here on, because the first can be there before the call
// that publishes it has returned.
std::vector<NatsMessage> NatsLink::takeSome() {
  std::vector<NatsMessage> taken;
  taken.reserve(kMessagesAtOnce);
  while (taken.size() < kMessagesAtOnce && pending_.hasAgain()) {
    taken.push_back(pending_.nextAgain());
  }
  publishedAgain_.add(taken.size());
  const Time deadline = std::chrono::steady_clock::now() +
                        std::chrono::duration_cast<std::chrono::steady_clock::duration>(ackTime_);
  while (!queue_.empty() && taken.size() < kMessagesAtOnce && pending_.hasRoom() &&
         !pending_.needsAgain()) {
    OutgoingMessage& next = queue_.front();
    queuedBytes_ -= next.bytes;
    pending_.add(next.message.get(), {std::move(next.ledger), next.number, next.bytes, deadline});
    taken.push_back(std::move(next.message));
    queue_.pop_front();
  }
  isWindowFull_ = !pending_.hasRoom();
  return taken;
}

void NatsLink::publishSome() {
  std::vector<NatsMessage> messages;
  {
    const MutexLock lock(mutex_);
    messages = takeSome();
  }
  publish(std::move(messages), kAttemptTime);
}

// Publishes the oldest message again, and nothing else until a server confirms it.
void NatsLink::probe() {
  provideStreamAgain();
  reclaim();
  std::vector<NatsMessage> messages;
  {
    const MutexLock lock(mutex_);
    pending_.beginAgain();
    if (!pending_.hasAgain()) {  // it is settled, or is so in a moment
      probeAt_ = std::chrono::steady_clock::now() + kResendPause;
      return;
    }
    flow_ = Flow::kProbing;
    messages.push_back(pending_.nextAgain());
  }
  publishedAgain_.add();
  publish(std::move(messages), kProbeTime);
}

// Takes back what the library still awaits acknowledgements for.
void NatsLink::reclaim() {
  natsMsgList list{};
  if (js_PublishAsyncGetPendingList(&list, context_.get()) != NATS_OK) return;
  {
    const MutexLock lock(mutex_);
    for (natsMsg*& message : std::span(list.Msgs, static_cast<std::size_t>(list.Count))) {
      (void)pending_.giveBack(NatsMessage(std::exchange(message, nullptr)));
    }
  }
  natsMsgList_Destroy(&list);
}

void NatsLink::publish(std::vector<NatsMessage> messages, std::chrono::milliseconds patience) {
  jsPubOptions publishing;
  jsPubOptions_Init(&publishing);
  publishing.MaxWait = patience.count();
  for (std::size_t index = 0; index < messages.size(); ++index) {
    natsMsg* raw = messages[index].release();
    natsMsg* const key = raw;
    const natsStatus status = js_PublishMsgAsync(context_.get(), &raw, &publishing);
    if (status == NATS_OK) continue;
    messages[index].reset(raw);
    if (isTemporary(status)) {
      return hold(std::span(messages).subspan(index), status);
    }
    const jsPubAckErr error{.Msg = key, .Err = status, .ErrCode = {}, .ErrText = nullptr};
    resolve(std::move(messages[index]), &error);
  }
}

// Keeps messages whose attempt failed, and all later ones, for another attempt.
void NatsLink::hold(std::span<NatsMessage> messages, natsStatus status) {
  std::optional<std::uint64_t> worthALine;
  {
    const MutexLock lock(mutex_);
    bool isKnown = flow_ == Flow::kProbing;
    for (NatsMessage& message : messages) {
      isKnown = pending_.giveBack(std::move(message)) || isKnown;
    }
    if (!isKnown || flow_ == Flow::kHolding) return;
    const Time now = std::chrono::steady_clock::now();
    if (flow_ == Flow::kProbing && status == NATS_NO_RESPONDERS) isStreamInDoubt_ = true;
    beginHolding(now + kResendPause);
    worthALine = holdLog_.note(1, now);
    changed_.notifyAll();
  }
  if (worthALine)
    kLog.notice("messages of the link wait to be published again: ", natsStatus_GetText(status));
}

void NatsLink::beginHolding(Time until) {
  if (pending_.size() == 0) return;
  flow_ = Flow::kHolding;
  probeAt_ = until;
}

void NatsLink::giveUpOverdue() {
  std::vector<PendingAcks::Entry> overdue;
  {
    const MutexLock lock(mutex_);
    overdue = pending_.takeOverdue(std::chrono::steady_clock::now());
  }
  abandon(overdue, "no acknowledgement in time");
}

void NatsLink::onAcknowledged(jsCtx*, natsMsg* message, jsPubAck*, jsPubAckErr* error, void* link) {
  NatsMessage owned(message);
  auto& self = *static_cast<NatsLink*>(link);
  if (error != nullptr && isTemporary(error->Err, error->ErrCode)) {
    return self.hold(std::span(&owned, 1), error->Err);
  }
  self.resolve(std::move(owned), error);
}

void NatsLink::resolve(NatsMessage message, const jsPubAckErr* error) {
  std::optional<PendingAcks::Entry> entry;
  {
    const MutexLock lock(mutex_);
    entry = pending_.take(message.get());
    message.reset();  // before the thread learns that nothing is outstanding, and ends the library
    const bool isProbed = flow_ == Flow::kProbing;
    if (isProbed) flow_ = Flow::kFlowing;
    const bool isAwaited = isProbed || pending_.needsAgain() ||
                           (isWindowFull_ && pending_.isHalfFree()) ||
                           (closeBy_ && pending_.size() == 0);
    if (isAwaited) changed_.notifyAll();
  }
  if (entry) settle(*entry, error);  // else given up before
}

void NatsLink::settle(const PendingAcks::Entry& entry, const jsPubAckErr* error) {
  if (error == nullptr) {
    acknowledged_.add();
  } else {
    const std::string_view reason = natsStatus_GetText(error->Err);
    countFailure(1, error->ErrText != nullptr ? error->ErrText : reason);
    statistics_.counter(kNatsPiece, std::string("failed: ") + std::string(reason)).add();
  }
  if (!entry.ledger) return;
  entry.ledger->resolve(entry.number,
                        error == nullptr ? AckOutcome::kAcknowledged : AckOutcome::kFailed);
}

void NatsLink::countFailure(std::uint64_t messages, std::string_view reason) {
  std::optional<std::uint64_t> worthALine;
  {
    const MutexLock lock(mutex_);
    worthALine = failureLog_.note(messages, std::chrono::steady_clock::now());
  }
  if (worthALine) {
    kLog.error("messages of the link that no server confirmed: ", *worthALine,
               ", the last: ", reason);
  }
}

void NatsLink::abandon(const std::vector<PendingAcks::Entry>& entries, std::string_view reason) {
  if (entries.empty()) return;
  notAcknowledged_.add(entries.size());
  countFailure(entries.size(), reason);
  for (const PendingAcks::Entry& entry : entries) {
    if (entry.ledger) entry.ledger->resolve(entry.number, AckOutcome::kFailed);
  }
}

void NatsLink::fail(const std::deque<OutgoingMessage>& messages, std::string_view reason) {
  if (messages.empty()) return;
  statistics_.counter(kNatsPiece, std::string("failed: ") + std::string(reason))
      .add(messages.size());
  countFailure(messages.size(), reason);
  for (const OutgoingMessage& message : messages) {
    if (message.ledger) message.ledger->resolve(message.number, AckOutcome::kFailed);
  }
}

}  // namespace halvox::platform::linux_
