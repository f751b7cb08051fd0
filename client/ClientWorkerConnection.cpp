#include <algorithm>
#include <utility>

#include "client/ClientWorker.h"

// The connection of the worker: how it is made, what is sent over it and what comes back.
namespace halvox::client {
namespace {

using platform::linux_::MutexLock;

// Enough to keep the service busy; few enough that the outcome of a message is known soon.
constexpr std::size_t kMaxOpenCalls = 256;
// The same in bytes. A single larger message is allowed.
constexpr std::size_t kMaxOpenBytes = std::size_t{4} << 20U;

}  // namespace

void ClientWorker::tryConnect() {
  // Watch before the attempt: a service that appears after it is then noticed.
  watch_.begin();
  auto connected = connectToService(placesToTry());
  if (auto* made = std::get_if<ConnectedBus>(&connected)) {
    bus_ = std::move(made->bus);
    place_ = std::move(made->place);
    state_ = State::kConnecting;
    handshakeEnds_ = std::chrono::steady_clock::now() + options_.requestTimeout;
    return;
  }
  pauseBeforeRetry();
  if (!closing_.load(std::memory_order_relaxed)) return;
  // Nobody can receive the pending messages, so the destructor need not wait longer.
  const MutexLock lock(mutex_);
  endNow_ = true;
  flushed_.notifyAll();
}

std::vector<std::string> ClientWorker::placesToTry() const {
  if (std::chrono::steady_clock::now() < samePlaceUntil_) return {place_};
  return places_;
}

void ClientWorker::processBus() {
  if (!bus_) return;
  int result = 0;
  do {
    result = sd_bus_process(bus_.get(), nullptr);
  } while (result > 0 && sd_bus_is_open(bus_.get()) > 0);
  if (result < 0 || sd_bus_is_open(bus_.get()) <= 0) {
    loseConnection();
  } else if (state_ == State::kConnecting) {
    if (sd_bus_is_ready(bus_.get()) > 0) {
      onReady();
    } else if (std::chrono::steady_clock::now() >= handshakeEnds_) {
      loseConnection();
    }
  }
}

void ClientWorker::onReady() {
  state_ = State::kReady;
  watch_.end();
  {
    const MutexLock lock(mutex_);
    shownPlace_ = place_;
  }
  const auto operations = made_.remake();
  remaking_.assign(operations.begin(), operations.end());
  if (std::exchange(everConnected_, true)) reconnects_.fetch_add(1, std::memory_order_relaxed);
  connected_.store(true, std::memory_order_relaxed);
  notifyConnection(true);
}

void ClientWorker::loseConnection() {
  std::deque<FlushTicket> flushes;
  for (const auto& call : open_) {
    if (call.isMessage) lost_.fetch_add(1, std::memory_order_release);
    if (call.flush != 0) flushes.push_back(call.flush);
  }
  interruptedFlushes_.insert(interruptedFlushes_.begin(), flushes.begin(), flushes.end());
  bus_.reset();  // its replies point at the calls, so it goes first
  open_.clear();
  openBytes_ = 0;
  remaking_.clear();
  const bool wasReady = state_ == State::kReady;
  if (wasReady) samePlaceUntil_ = std::chrono::steady_clock::now() + options_.samePlaceFor;
  state_ = State::kAbsent;
  connected_.store(false, std::memory_order_relaxed);
  pauseBeforeRetry();
  if (wasReady) notifyConnection(false);
}

void ClientWorker::pauseBeforeRetry() {
  watch_.begin();
  retryAt_ = std::chrono::steady_clock::now() + pause_;
  pause_ = std::min(pause_ * 2, options_.reconnectMax);
}

void ClientWorker::retryNow() {
  if (state_ != State::kAbsent) return;
  // A socket appears a moment before the service listens on it. Try again soon.
  pause_ = options_.reconnectMin;
  retryAt_ = {};
}

void ClientWorker::notifyConnection(bool connected) {
  std::shared_ptr<ConnectionHandler> handler;
  {
    const MutexLock lock(mutex_);
    handler = handler_;
    handlerIsNew_ = false;
  }
  if (handler) (*handler)(connected);
}

void ClientWorker::notifyNewHandler() {
  {
    const MutexLock lock(mutex_);
    if (!handlerIsNew_) return;
  }
  if (state_ == State::kReady) notifyConnection(true);
}

bool ClientWorker::isWindowOpen() const {
  return state_ == State::kReady && open_.size() < kMaxOpenCalls && openBytes_ < kMaxOpenBytes;
}

bool ClientWorker::sendNext() {
  if (!remaking_.empty()) {
    const SessionOperation operation = std::move(remaking_.front());
    remaking_.pop_front();
    sendOperation(operation);
    return true;
  }
  if (!interruptedFlushes_.empty()) {
    const FlushTicket ticket = interruptedFlushes_.front();
    interruptedFlushes_.pop_front();
    sendFlush(ticket);
    return true;
  }
  // Look at the ring first: operations that a thread posted before this message are then visible in
  // the lane.
  const bool hasMessage = ring_.isReady();
  if (lanePosition_.load(std::memory_order_acquire) <= ring_.head()) {
    sendFromLane();
  } else if (hasMessage) {
    sendMessageAtHead();
  } else {
    return false;
  }
  return true;
}

void ClientWorker::sendFromLane() {
  LaneEntry entry;
  {
    const MutexLock lock(mutex_);
    if (lane_.empty()) return;
    entry = std::move(lane_.front());
    lane_.pop_front();
    lanePosition_.store(lane_.empty() ? UINT64_MAX : lane_.front().position,
                        std::memory_order_release);
  }
  if (const auto* ticket = std::get_if<FlushTicket>(&entry.step)) {
    sendFlush(*ticket);
    return;
  }
  const auto& operation = std::get<SessionOperation>(entry.step);
  // Note it before sending: if the connection ends here, it is made again with the rest.
  made_.apply(operation);
  sendOperation(operation);
}

void ClientWorker::sendOperation(const SessionOperation& operation) {
  Request request = makeRequest(bus_.get(), operation);
  if (!std::holds_alternative<StartSession>(operation.step)) {
    // Only a configuration that the wire cannot hold fails here. Trying again would not help.
    if (call(std::move(request), {}) == CallOutcome::kDisconnected) loseConnection();
    return;
  }
  // The service answers a start at the stop. The client does not wait for that, so it asks for no
  // answer.
  const auto* message = std::get_if<BusMessage>(&request);
  if (message == nullptr || sd_bus_send(bus_.get(), message->get(), nullptr) < 0) loseConnection();
}

void ClientWorker::sendFlush(FlushTicket ticket) {
  // Send a query that changes nothing. Its answer comes after all earlier answers.
  if (call(makeRequest(bus_.get(), "reporterIDValid", 0), {.flush = ticket}) ==
      CallOutcome::kSent) {
    return;
  }
  interruptedFlushes_.push_front(ticket);
  loseConnection();
}

void ClientWorker::sendMessageAtHead() {
  const OutgoingMessage& message = ring_.front();
  const CallOutcome outcome =
      call(makeSendMessage(bus_.get(), message), {.bytes = message.weight(), .isMessage = true});
  switch (outcome) {
    case CallOutcome::kSent:
      ring_.pop();
      break;
    case CallOutcome::kNoWireForm:
      ring_.pop();
      refused_.fetch_add(1, std::memory_order_release);
      break;
    case CallOutcome::kDisconnected:
      loseConnection();  // the message stays where it is, for the next connection
      break;
  }
}

ClientWorker::CallOutcome ClientWorker::call(Request&& request, const OpenCall& description) {
  auto* message = std::get_if<BusMessage>(&request);
  if (message == nullptr) return CallOutcome::kNoWireForm;
  OpenCall& opened = open_.emplace_back(description);
  opened.worker = this;
  opened.self = std::prev(open_.end());
  const int result =
      sd_bus_call_async(bus_.get(), nullptr, message->get(), onReply, &opened, kNoTimeout);
  if (result >= 0) {
    openBytes_ += opened.bytes;
    return CallOutcome::kSent;
  }
  open_.pop_back();
  // The connection works, so the library refused the message, usually for its size.
  return sd_bus_is_open(bus_.get()) > 0 ? CallOutcome::kNoWireForm : CallOutcome::kDisconnected;
}

int ClientWorker::onReply(sd_bus_message* answer, void* userData, sd_bus_error* /*error*/) {
  auto& call = *static_cast<OpenCall*>(userData);
  ClientWorker& worker = *call.worker;
  // When the connection ends, the library itself answers open calls; loseConnection() counts them.
  if (sd_bus_is_open(worker.bus_.get()) <= 0) return 0;
  worker.onAnswer(call, sd_bus_message_is_method_error(answer, nullptr) > 0);
  return 0;
}

void ClientWorker::onAnswer(OpenCall& call, bool isError) {
  pause_ = options_.reconnectMin;  // the service is well
  if (call.isMessage) (isError ? refused_ : acknowledged_).fetch_add(1, std::memory_order_release);
  openBytes_ -= call.bytes;
  if (call.flush != 0) {
    call.isAnswered = true;
  } else {
    open_.erase(call.self);
  }
  finishFlushes();
}

void ClientWorker::finishFlushes() {
  FlushTicket done = 0;
  while (!open_.empty() && open_.front().isAnswered) {
    done = open_.front().flush;
    open_.pop_front();
  }
  if (done == 0) return;
  const MutexLock lock(mutex_);
  flushDone_ = std::max(flushDone_, done);
  flushed_.notifyAll();
}

}  // namespace halvox::client
