#include "platform/linux/connection/TurnSchedule.h"

#include <utility>

#include "platform/linux/connection/ClientConnection.h"
#include "platform/linux/connection/ConnectionLimits.h"
#include "platform/linux/connection/SocketStream.h"

namespace halvox::platform::linux_ {

TurnSchedule::TurnSchedule(std::function<void()> beginBatch, std::function<void()> endBatch,
                           std::function<void()> afterReplies)
    : beginBatch_(std::move(beginBatch)),
      endBatch_(std::move(endBatch)),
      afterReplies_(std::move(afterReplies)),
      requestsPerClient_(kTurnRequests) {}

void TurnSchedule::deliverNext(std::shared_ptr<ClientConnection> client) {
  next_.push_back(std::move(client));
}

void TurnSchedule::deliverWhenRelieved(std::shared_ptr<ClientConnection> client) {
  waitingForRelief_.push_back(std::move(client));
}

void TurnSchedule::flushLater(SocketStream& stream) { flushing_.push_back(&stream); }

void TurnSchedule::finishNext(std::shared_ptr<ClientConnection> client) {
  ending_.push_back(std::move(client));
}

// Begins the batch at the first call of a turn. A turn without deliveries, such as one that only
// writes, needs no batch.
void TurnSchedule::beforeDelivery() {
  if (inBatch_) return;
  inBatch_ = true;
  if (beginBatch_) beginBatch_();
}

bool TurnSchedule::hasWork() const {
  return !next_.empty() || !ending_.empty() || !flushing_.empty();
}

void TurnSchedule::begin() {
  // A client that becomes due during this turn goes into the other list and waits for the next
  // turn. Both lists keep their capacity.
  std::swap(due_, next_);
  std::swap(ended_, ending_);
}

void TurnSchedule::deliver(std::size_t readyCount) {
  // The clients that had events in this turn have already delivered. They used the share of the
  // previous turn, because the number of clients in this turn was not known before now.
  requestsPerClient_ = readyCount + due_.size() <= kFewClients ? kTurnRequests : kShortTurnRequests;
  for (const std::shared_ptr<ClientConnection>& client : due_) client->deliver();
  due_.clear();
}

void TurnSchedule::finishEnded() {
  for (std::shared_ptr<ClientConnection>& client : ended_) {
    // The handlers add clean-up jobs to queues, and these jobs must be part of this turn's batch.
    beforeDelivery();
    client->finish();
    finished_.push_back(std::move(client));
  }
  ended_.clear();
}

void TurnSchedule::endDeliveries() {
  if (!std::exchange(inBatch_, false)) return;
  hasReplies_ = true;
  if (endBatch_) endBatch_();
}

void TurnSchedule::relieve() {
  // Empty the list first, because a client that must wait again is added to it.
  Clients relieved;
  std::swap(relieved, waitingForRelief_);
  for (const std::shared_ptr<ClientConnection>& client : relieved) client->onRelief();
}

void TurnSchedule::flush() {
  // The list does not grow in this loop: after a flush, the stream's owner may deliver or end in
  // the next turn, but requests no other flush now.
  for (SocketStream* stream : flushing_) stream->flush();
  flushing_.clear();
  // Wake the pool last. A pool thread that is woken earlier competes for a core with the thread
  // that writes the replies.
  if (std::exchange(hasReplies_, false) && afterReplies_) afterReplies_();
}

void TurnSchedule::clear() {
  for (Clients* clients : {&due_, &next_, &waitingForRelief_, &ending_, &ended_, &finished_}) {
    std::exchange(*clients, {});
  }
  flushing_.clear();
}

}  // namespace halvox::platform::linux_
