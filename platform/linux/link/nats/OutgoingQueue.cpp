#include "platform/linux/link/nats/OutgoingQueue.h"

#include <algorithm>

#include "platform/linux/link/nats/NatsLog.h"

namespace halvox::platform::linux_ {

OutgoingQueue::OutgoingQueue(LinkSpool* spool, StatisticsService& statistics)
    : spool_(spool),
      kept_(statistics.counter(kNatsPiece, "kept in the store")),
      readFromSpool_(statistics.counter(kNatsPiece, "read from the store")) {}

void OutgoingQueue::resume(std::function<void()> stored) {
  if (spool_ == nullptr) return;
  spool_->onStored([this, stored = std::move(stored)] {
    stored_.fetch_add(1);
    // Most transactions concern nobody, because the queue waits only for the last messages of the
    // spool.
    if (awaitsStored_.exchange(false)) stored();
  });
  if (spool_->lastAppended() > 0) mode_ = Mode::kSpool;
}

LinkSpool::Number OutgoingQueue::append(natsMsg* message) {
  const char* identifier = "";
  static_cast<void>(natsMsgHeader_Get(message, kMessageIdHeader, &identifier));
  const LinkSpool::Number number = spool_->append(
      {.subject = natsMsg_GetSubject(message),
       .identifier = identifier,
       .body = std::string(natsMsg_GetData(message),
                           static_cast<std::size_t>(natsMsg_GetDataLength(message)))});
  if (number != 0) kept_.add();
  return number;
}

std::optional<Error> OutgoingQueue::take(OutgoingMessage& message, PendingAcks& pending, Kept& kept,
                                         Time now) {
  const bool isFull = memoryBytes_ + message.bytes > kQueueBytes;
  if (!isOnline_ || isFull) {
    const std::optional<Time> time = keepTime(pending);
    if (canKeep() && (isFull || (time && now >= *time))) keep(pending, kept);
  }
  // The store would drop the message. What it has kept before precedes those that wait in memory.
  if (mode_ == Mode::kSpool && !canKeep()) mode_ = Mode::kCatchingUp;
  if (mode_ == Mode::kSpool) return takeIntoSpool(message, kept);
  if (isFull) {
    return refusedByLink("the queue to NATS is full: " + std::to_string(memory_.size()) +
                         " messages wait for a server");
  }
  message.taken = now;
  memoryBytes_ += message.bytes;
  memory_.push_back(std::move(message));
  return std::nullopt;
}

std::optional<Error> OutgoingQueue::takeIntoSpool(OutgoingMessage& message, Kept& kept) {
  if (append(message.message.get()) == 0) return refusedByLink("the store is closed");
  if (message.ledger) kept.emplace_back(std::move(message.ledger), message.number);
  message = {};
  return std::nullopt;
}

void OutgoingQueue::keep(PendingAcks& pending, Kept& kept) {
  if (spool_ == nullptr) return;
  if (mode_ == Mode::kMemory) {
    readThrough_ = spool_->lastAppended();
    // The published messages stay in flight. Their copies are read only after rewind().
    pending.forEachUnspooled([this](natsMsg* message) {
      const LinkSpool::Number number = append(message);
      if (number == 0) return number;
      inFlight_.insert(number);
      readThrough_ = number;
      return number;
    });
  }
  mode_ = Mode::kSpool;
  while (!memory_.empty()) {
    OutgoingMessage& next = memory_.front();
    const std::size_t bytes = next.bytes;
    // The store is closed. What is still here fails with the end of the link.
    if (takeIntoSpool(next, kept)) return;
    memoryBytes_ -= bytes;
    memory_.pop_front();
  }
}

std::optional<OutgoingQueue::Time> OutgoingQueue::keepTime(const PendingAcks& pending) const {
  if (mode_ == Mode::kSpool || !canKeep()) return std::nullopt;
  std::optional<Time> since;
  if (!memory_.empty()) since = memory_.front().taken;
  if (const auto published = pending.firstUnspooled(); published && mode_ == Mode::kMemory) {
    since = std::min(since.value_or(*published), *published);
  }
  if (!since) return std::nullopt;
  return *since + kMemoryTime;
}

bool OutgoingQueue::hasUnsent() const {
  if (!memory_.empty() || !read_.empty()) return true;
  return mode_ != Mode::kMemory && settledThrough() < spool_->lastAppended();
}

OutgoingMessage OutgoingQueue::takeNext() {
  const bool isRead = !read_.empty();
  std::deque<OutgoingMessage>& queue = isRead ? read_ : memory_;
  OutgoingMessage next = std::move(queue.front());
  queue.pop_front();
  if (!isRead) memoryBytes_ -= next.bytes;
  return next;
}

std::deque<OutgoingMessage> OutgoingQueue::takeAll() {
  memoryBytes_ = 0;
  return std::exchange(memory_, {});
}

bool OutgoingQueue::mustRead(Time now) const {
  if (mode_ == Mode::kMemory || !isOnline_ || !read_.empty()) return false;
  if (readAfterStored_ == stored_.load()) return false;
  return !nextRead_ || now >= *nextRead_;
}

OutgoingQueue::ReadPlan OutgoingQueue::planRead() const {
  // In this order: what is stored after this count can only be missing from the read if it counts
  // as unstored, or if the count has grown when the read ends.
  const std::uint64_t stored = stored_.load();
  return {.after = readThrough_, .stored = stored, .hasUnstored = spool_->hasUnstored()};
}

void OutgoingQueue::addRead(const ReadPlan& plan, const LinkSpool::Read& read,
                            std::vector<OutgoingMessage> messages) {
  nextRead_.reset();
  // The messages were kept or rewound meanwhile. They are read again.
  if (mode_ == Mode::kMemory || plan.after != readThrough_) return;
  if (read.through == plan.after) {
    if (mode_ == Mode::kSpool) {
      mode_ = Mode::kCatchingUp;
    } else if (!plan.hasUnstored) {
      mode_ = Mode::kMemory;
      readAfterStored_.reset();
    } else {
      readAfterStored_ = plan.stored;
      awaitsStored_.store(true);
    }
    return;
  }
  readThrough_ = read.through;
  readFromSpool_.add(messages.size());
  for (OutgoingMessage& message : messages) {
    inFlight_.insert(message.spooled);
    read_.push_back(std::move(message));
  }
  forgetSettled();
}

void OutgoingQueue::settle(LinkSpool::Number number) {
  inFlight_.erase(number);
  forgetSettled();
}

void OutgoingQueue::rewind() {
  if (spool_ == nullptr) return;
  readThrough_ = settledThrough();
  readAfterStored_.reset();
  inFlight_.clear();
  read_.clear();
  // This may be the end of the process. The next one must not send again what was acknowledged.
  forgetSettled();
}

LinkSpool::Number OutgoingQueue::settledThrough() const {
  return inFlight_.empty() ? readThrough_ : *inFlight_.begin() - 1;
}

void OutgoingQueue::forgetSettled() {
  const LinkSpool::Number through = settledThrough();
  if (through <= forgottenThrough_) return;
  if (!inFlight_.empty() && through - forgottenThrough_ < kForgottenAtOnce) return;
  forgottenThrough_ = through;
  spool_->removeThrough(through);
}

}  // namespace halvox::platform::linux_
