#include <algorithm>
#include <utility>

#include "client/ClientWorker.h"

// The part of the worker that connects, sends and receives.
namespace halvox::client {
namespace {

using platform::linux_::MutexLock;

// How many calls may be open. This is enough to keep the service busy, and few enough that the
// outcome of a message is known soon.
constexpr std::size_t kMaxOpenCalls = 256;
// How many bytes the messages of the open calls may have. A single message may be larger.
constexpr std::size_t kMaxOpenBytes = std::size_t{4} << 20U;
// A full window opens again when half of its calls are answered. This makes writes fewer and
// larger.
constexpr std::size_t kReopenAtCalls = kMaxOpenCalls / 2;
constexpr std::size_t kReopenAtBytes = kMaxOpenBytes / 2;
// The client keeps track of the calls from the oldest unanswered one to the newest. If there are
// more than this, it considers the service broken and closes the connection.
constexpr std::size_t kMostTrackedCalls = std::size_t{1} << 16U;
// After this many sent messages, their cells in the ring are released for the producers.
constexpr int kReleaseAfter = 64;

}  // namespace

void ClientWorker::tryConnect() {
  // Begin to watch before the attempt. A service that appears after the attempt is then noticed.
  watch_.begin();
  auto connected = connectToService(placesToTry());
  if (auto* made = std::get_if<ConnectedStream>(&connected)) {
    stream_ = std::move(made->stream);
    place_ = std::move(made->place);
    state_ = State::kConnecting;
    handshakeEnds_ = std::chrono::steady_clock::now() + options_.requestTimeout;
    return;
  }
  pauseBeforeRetry();
  if (!closing_.load(std::memory_order_relaxed)) return;
  // The client is being destroyed. The destructor need not wait longer, because there is no service
  // for the pending messages.
  const MutexLock lock(mutex_);
  endNow_ = true;
  flushed_.notifyAll();
}

std::vector<std::string> ClientWorker::placesToTry() const {
  if (std::chrono::steady_clock::now() < samePlaceUntil_) return {place_};
  return places_;
}

void ClientWorker::processStream() {
  if (state_ == State::kAbsent) return;
  const bool alive =
      stream_.isOpen() && stream_.send() && (!std::exchange(readable_, false) || receive());
  if (!alive || open_.size() > kMostTrackedCalls) {
    loseConnection();
  } else if (state_ == State::kConnecting) {
    if (stream_.isReady()) {
      onReady();
    } else if (std::chrono::steady_clock::now() >= handshakeEnds_) {
      loseConnection();
    }
  }
}

bool ClientWorker::receive() { return stream_.receive() && (!stream_.isReady() || takeAnswers()); }

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
    if (call.kind == OpenCall::Kind::kMessage && !call.isAnswered) {
      lost_.fetch_add(1, std::memory_order_release);
    }
    if (call.kind == OpenCall::Kind::kFlush) flushes.push_back(call.flush);
  }
  interruptedFlushes_.insert(interruptedFlushes_.begin(), flushes.begin(), flushes.end());
  stream_ = {};
  open_.clear();
  unanswered_ = 0;
  openBytes_ = 0;
  windowIsOpen_ = true;
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
  // A socket appears a moment before the service listens on it. Use the shortest pauses, because
  // the first attempt may come too early.
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

void ClientWorker::updateWindow() {
  if (unanswered_ >= kMaxOpenCalls || openBytes_ >= kMaxOpenBytes) windowIsOpen_ = false;
  if (unanswered_ <= kReopenAtCalls && openBytes_ <= kReopenAtBytes) windowIsOpen_ = true;
}

void ClientWorker::sendAll() {
  const std::uint64_t before = ring_.head();
  for (int count = 1; isWindowOpen() && sendNext(); ++count) {
    if (count % kReleaseAfter == 0) ring_.release();
  }
  ring_.release();
  if (ring_.head() != before) lastMessage_ = std::chrono::steady_clock::now();
  // Ignore a failure here. The worker notices it when it next looks at the connection.
  if (stream_.isOpen()) stream_.send();
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
  // Look at the ring before the lane. If there is a message, the operations that its thread posted
  // before it are then visible in the lane.
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
  // Apply the operation to made_ before sending it. If the connection ends now, the operation is
  // then repeated on the next connection.
  made_.apply(operation);
  sendOperation(operation);
}

void ClientWorker::sendOperation(const SessionOperation& operation) {
  Request request = makeRequest(operation);
  // This fails only for a configuration that cannot be encoded for the wire. Drop it, because
  // trying again would not help.
  auto* frame = std::get_if<std::string>(&request);
  if (frame == nullptr) return;
  if (std::holds_alternative<StartSession>(operation.step)) {
    // The service answers a start only at the stop. The client does not wait for that, and asks the
    // service not to answer.
    numberWithoutAnswer(frame->data());
  } else {
    numberCall(frame->data(), {});
  }
  stream_.append(*frame);
}

void ClientWorker::sendFlush(FlushTicket ticket) {
  // Send a query that changes nothing. Its answer comes after all earlier answers.
  Request request = makeRequest("reporterIDValid", 0);
  auto& frame = std::get<std::string>(request);
  numberCall(frame.data(), {.kind = OpenCall::Kind::kFlush, .flush = ticket});
  stream_.append(frame);
}

void ClientWorker::sendMessageAtHead() {
  const std::size_t bytes = kMessageHeaderBytes + ring_.frontBytes();
  char* frame = stream_.append(bytes);
  putMessageHeader(frame, ring_.frontBytes());
  ring_.take(frame + kMessageHeaderBytes);
  numberCall(frame, {.kind = OpenCall::Kind::kMessage, .bytes = static_cast<std::uint32_t>(bytes)});
}

void ClientWorker::numberCall(char* frame, const OpenCall& call) {
  // No call may have the serial 0. Add an entry in its place that counts as answered, because the
  // serials in open_ must be consecutive.
  if (++lastSerial_ == 0 && !open_.empty()) open_.push_back({.isAnswered = true});
  if (lastSerial_ == 0) ++lastSerial_;
  setSerial(frame, lastSerial_);
  open_.push_back(call);
  ++unanswered_;
  openBytes_ += call.bytes;
  updateWindow();
}

void ClientWorker::numberWithoutAnswer(char* frame) {
  numberCall(frame, {});
  setNoReplyExpected(frame);
  --unanswered_;
  open_.back().isAnswered = true;
  updateWindow();
  finishFlushes();
}

bool ClientWorker::takeAnswers() {
  for (;;) {
    const NextFrame next = nextFrame(stream_.input());
    switch (next.state) {
      case NextFrame::State::kIncomplete:
        finishFlushes();
        return true;
      case NextFrame::State::kBroken:
        stream_.end();
        return false;
      case NextFrame::State::kAnswer:
        onAnswer(next.answer);
        break;
      case NextFrame::State::kOther:
        break;
    }
    stream_.consume(next.bytes);
  }
}

void ClientWorker::onAnswer(const Answer& answer) {
  const std::uint32_t first = lastSerial_ - static_cast<std::uint32_t>(open_.size()) + 1;
  const std::uint32_t index = answer.replySerial - first;
  if (index >= open_.size() || open_[index].isAnswered) return;  // answers no open call
  OpenCall& call = open_[index];
  call.isAnswered = true;
  --unanswered_;
  openBytes_ -= call.bytes;
  pause_ = options_.reconnectMin;  // the service works
  if (call.kind == OpenCall::Kind::kMessage) {
    (answer.isError ? refused_ : acknowledged_).fetch_add(1, std::memory_order_release);
  }
  updateWindow();
}

void ClientWorker::finishFlushes() {
  FlushTicket done = 0;
  while (!open_.empty() && open_.front().isAnswered) {
    done = std::max(done, open_.front().flush);
    open_.pop_front();
  }
  if (done == 0) return;
  const MutexLock lock(mutex_);
  flushDone_ = std::max(flushDone_, done);
  flushed_.notifyAll();
}

}  // namespace halvox::client
