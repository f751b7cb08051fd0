#include <algorithm>
#include <iterator>
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

// Returns true if the call with that serial was not sent after the last one that the service has
// taken.
bool isTaken(std::uint32_t serial, std::uint32_t lastTaken) {
  // Serials start again at 1 after the largest one. The difference is small in either direction.
  return lastTaken != 0 && static_cast<std::int32_t>(lastTaken - serial) >= 0;
}

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
    takeLastAnswers();
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

// Decides for each open call whether its work is done, lost, or to be sent to the next service.
void ClientWorker::settleOpenCalls() {
  const std::optional<std::uint32_t> lastTaken = std::exchange(lastTaken_, std::nullopt);
  std::deque<Untaken> untaken;
  std::deque<FlushTicket> flushes;
  std::uint32_t serial = lastSerial_ - static_cast<std::uint32_t>(open_.size());
  for (const OpenCall& call : open_) {
    ++serial;
    const bool isUntaken = lastTaken.has_value() && !isTaken(serial, *lastTaken);
    if (call.kind == OpenCall::Kind::kFlush) {
      flushes.push_back(call.flush);
    } else if (call.kind == OpenCall::Kind::kOperation) {
      if (isUntaken) {
        untaken.emplace_back(std::move(openOperations_.front()));
      } else {
        made_.apply(openOperations_.front());
      }
      openOperations_.pop_front();
    } else if (call.kind == OpenCall::Kind::kMessage && !call.isAnswered) {
      if (isUntaken) {
        untaken.emplace_back(call.frame);
      } else if (lastTaken.has_value()) {
        ring_.drop(call.frame);
        acknowledged_.fetch_add(1, std::memory_order_release);
      } else {
        giveUpMessage(call.frame);
      }
    }
  }
  untaken_.insert(untaken_.begin(), std::move_iterator(untaken.begin()),
                  std::move_iterator(untaken.end()));
  interruptedFlushes_.insert(interruptedFlushes_.begin(), flushes.begin(), flushes.end());
  open_.clear();
  ring_.release();
}

void ClientWorker::loseConnection() {
  settleOpenCalls();
  stream_ = {};
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
  while (isWindowOpen() && sendNext()) continue;
  if (ring_.head() != before) lastMessage_ = std::chrono::steady_clock::now();
  // Ignore a failure here. The worker looks at the connection again before it sleeps.
  if (stream_.isOpen()) stream_.send();
}

bool ClientWorker::sendNext() {
  if (!remaking_.empty()) {
    const SessionOperation operation = std::move(remaking_.front());
    remaking_.pop_front();
    sendStep(operation, OpenCall::Kind::kOther);
    return true;
  }
  if (!untaken_.empty()) {
    sendUntaken();
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
    sendMessage(ring_.take());
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
  sendOperation(std::move(std::get<SessionOperation>(entry.step)));
}

void ClientWorker::sendUntaken() {
  Untaken untaken = std::move(untaken_.front());
  untaken_.pop_front();
  if (const auto* frame = std::get_if<FrameRing::FrameNumber>(&untaken)) {
    sendMessage(*frame);
  } else {
    sendOperation(std::move(std::get<SessionOperation>(untaken)));
  }
}

void ClientWorker::sendOperation(SessionOperation operation) {
  // Keep the operation before sending it, because an operation without an answer is complete at
  // once.
  openOperations_.push_back(std::move(operation));
  if (!sendStep(openOperations_.back(), OpenCall::Kind::kOperation)) openOperations_.pop_back();
}

// Returns false for an operation that has no form on the wire.
bool ClientWorker::sendStep(const SessionOperation& operation, OpenCall::Kind kind) {
  Request request = makeRequest(operation);
  // This fails only for a configuration that cannot be encoded for the wire. Drop it, because
  // trying again would not help.
  auto* frame = std::get_if<std::string>(&request);
  if (frame == nullptr) return false;
  if (std::holds_alternative<StartSession>(operation.step)) {
    // The service answers a start only at the stop. The client does not wait for that, and asks the
    // service not to answer.
    numberWithoutAnswer(frame->data(), {.kind = kind});
  } else {
    numberCall(frame->data(), {.kind = kind});
  }
  stream_.append(*frame);
  return true;
}

void ClientWorker::sendFlush(FlushTicket ticket) {
  // Send a query that changes nothing. Its answer comes after all earlier answers.
  Request request = makeRequest("reporterIDValid", 0);
  auto& frame = std::get<std::string>(request);
  numberCall(frame.data(), {.kind = OpenCall::Kind::kFlush, .flush = ticket});
  stream_.append(frame);
}

void ClientWorker::sendMessage(FrameRing::FrameNumber frame) {
  const std::size_t bodyBytes = ring_.bytesOf(frame);
  const std::size_t bytes = kMessageHeaderBytes + bodyBytes;
  char* const whole = stream_.append(bytes);
  putMessageHeader(whole, bodyBytes);
  ring_.copy(frame, whole + kMessageHeaderBytes);
  numberCall(whole, {.kind = OpenCall::Kind::kMessage,
                     .bytes = static_cast<std::uint32_t>(bytes),
                     .frame = frame});
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

void ClientWorker::numberWithoutAnswer(char* frame, const OpenCall& call) {
  numberCall(frame, call);
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
        ring_.release();
        return true;
      case NextFrame::State::kBroken:
        stream_.end();
        return false;
      case NextFrame::State::kAnswer:
        onAnswer(next.answer);
        break;
      case NextFrame::State::kEnded:
        lastTaken_ = next.lastRequest;
        stream_.end();
        return false;
      case NextFrame::State::kOther:
        break;
    }
    stream_.consume(next.bytes);
  }
}

// Takes what the service sent before it closed the connection.
void ClientWorker::takeLastAnswers() {
  if (state_ != State::kReady || lastTaken_.has_value()) return;
  while (stream_.receiveRest() && takeAnswers()) continue;
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
    ring_.drop(call.frame);
    (answer.isError ? refused_ : acknowledged_).fetch_add(1, std::memory_order_release);
  }
  updateWindow();
}

void ClientWorker::finishFlushes() {
  FlushTicket done = 0;
  while (!open_.empty() && open_.front().isAnswered) {
    const OpenCall& call = open_.front();
    done = std::max(done, call.flush);
    if (call.kind == OpenCall::Kind::kOperation) {
      made_.apply(openOperations_.front());
      openOperations_.pop_front();
    }
    open_.pop_front();
  }
  if (done == 0) return;
  const MutexLock lock(mutex_);
  flushDone_ = std::max(flushDone_, done);
  flushed_.notifyAll();
}

}  // namespace halvox::client
