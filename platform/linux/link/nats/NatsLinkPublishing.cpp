#include <string>
#include <utility>

#include "platform/linux/link/nats/NatsLink.h"
#include "platform/linux/link/nats/NatsLog.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog(natsLogCategory, "NatsLink");

// Messages that are published under one hold of the lock before and none while publishing.
constexpr std::size_t kMessagesAtOnce = 64;

}  // namespace

// Their acknowledgements are expected from here on, because the first can be there before the call
// that publishes it has returned.
std::vector<OutgoingMessage> NatsLink::takeSome() {
  std::vector<OutgoingMessage> taken;
  taken.reserve(kMessagesAtOnce);
  while (!queue_.empty() && taken.size() < kMessagesAtOnce && pending_.hasRoom()) {
    OutgoingMessage& next = queue_.front();
    queuedBytes_ -= next.bytes;
    pending_.add(next.message.get(), {next.ledger, next.number, next.bytes});
    taken.push_back(std::move(next));
    queue_.pop_front();
  }
  isWindowFull_ = !pending_.hasRoom();
  return taken;
}

void NatsLink::publishSome() {
  std::vector<OutgoingMessage> messages;
  {
    const MutexLock lock(mutex_);
    messages = takeSome();
  }
  jsPubOptions publishing;
  jsPubOptions_Init(&publishing);
  publishing.MaxWait = std::chrono::milliseconds(kAckTime).count();
  for (std::size_t index = 0; index < messages.size(); ++index) {
    natsMsg* raw = messages[index].message.release();
    natsMsg* const key = raw;
    const natsStatus status = js_PublishMsgAsync(context_.get(), &raw, &publishing);
    if (status == NATS_OK) continue;
    messages[index].message.reset(raw);
    if (status == NATS_INSUFFICIENT_BUFFER || status == NATS_CONNECTION_CLOSED) {
      return putBack(std::move(messages), index);
    }
    const jsPubAckErr error{.Msg = key, .Err = status, .ErrCode = {}, .ErrText = nullptr};
    resolve(std::move(messages[index].message), &error);
  }
}

void NatsLink::putBack(std::vector<OutgoingMessage> messages, std::size_t first) {
  const MutexLock lock(mutex_);
  // A connection that came back meanwhile, or is lost for good, is seen before the next attempt.
  isBufferFull_ = !isConnected_;
  for (std::size_t index = messages.size(); index > first; --index) {
    OutgoingMessage& message = messages[index - 1];
    (void)pending_.take(message.message.get());
    queuedBytes_ += message.bytes;
    queue_.push_front(std::move(message));
  }
}

void NatsLink::onAcknowledged(jsCtx*, natsMsg* message, jsPubAck*, jsPubAckErr* error, void* link) {
  static_cast<NatsLink*>(link)->resolve(NatsMessage(message), error);
}

void NatsLink::resolve(NatsMessage message, const jsPubAckErr* error) {
  std::optional<PendingAcks::Entry> entry;
  {
    const MutexLock lock(mutex_);
    entry = pending_.take(message.get());
    message.reset();  // before the thread learns that nothing is outstanding, and ends the library
    const bool isAwaited =
        (isWindowFull_ && pending_.isHalfFree()) || (closeBy_ && pending_.size() == 0);
    if (isAwaited) changed_.notifyAll();
  }
  if (!entry) return;  // given up before
  if (error == nullptr) {
    acknowledged_.add();
  } else {
    countFailure(1, natsStatus_GetText(error->Err));
    if (error->Err == NATS_TIMEOUT) {
      notAcknowledged_.add();
    } else {
      statistics_.counter(kNatsPiece, std::string("failed: ") + natsStatus_GetText(error->Err))
          .add();
    }
  }
  if (!entry->ledger) return;
  entry->ledger->resolve(entry->number,
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

void NatsLink::abandon(std::vector<PendingAcks::Entry> entries) {
  if (entries.empty()) return;
  notAcknowledged_.add(entries.size());
  countFailure(entries.size(), "the connection ended");
  for (const PendingAcks::Entry& entry : entries) {
    if (entry.ledger) entry.ledger->resolve(entry.number, AckOutcome::kFailed);
  }
}

void NatsLink::fail(std::deque<OutgoingMessage> messages, std::string_view reason) {
  if (messages.empty()) return;
  statistics_.counter(kNatsPiece, std::string("failed: ") + std::string(reason))
      .add(messages.size());
  countFailure(messages.size(), reason);
  for (const OutgoingMessage& message : messages) {
    if (message.ledger) message.ledger->resolve(message.number, AckOutcome::kFailed);
  }
}

}  // namespace halvox::platform::linux_
