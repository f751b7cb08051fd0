#include "client/ClientWorker.h"

#include <algorithm>
#include <array>
#include <span>
#include <utility>

#include <sys/eventfd.h>
#include <unistd.h>

#include "client/PollUntil.h"
#include "platform/linux/base/ThreadSetup.h"

namespace halvox::client {
namespace {

using platform::linux_::MutexLock;

constexpr std::size_t kMaxWaitingOperations = 8192;
constexpr std::chrono::seconds kFarewell{1};
// How often to look for work if the system has no descriptor left with which producers could wake
// the thread.
constexpr std::chrono::milliseconds kPauseWithoutWakeUp{50};
// While messages arrive, the worker naps instead of sleeping. A nap lasts an eighth of the time
// since the last message, within these bounds. During the shortest nap, several messages can gather
// for one write. The longest nap costs a real-time client a hundred wake-ups a second while a
// session runs, about as many as its audio thread makes.
constexpr std::chrono::milliseconds kShortestNap{1};
constexpr std::chrono::milliseconds kLongestNap{10};
constexpr int kNapShare = 8;
// How long after a message the worker naps. A client that sends at least twenty messages a second
// never has to wake this thread. A slower client wakes it for each message, and the thread then
// wakes up 21 to 27 times by itself (measured).
constexpr std::chrono::milliseconds kNapsAfterMessage{50};
// How long a thread that calls flush() does the worker's work itself. The service answers a request
// within microseconds unless it is busy. If it is busy, the cost of switching to the worker's
// thread does not matter.
constexpr std::chrono::milliseconds kLongestHelp{2};
// Stands for "wait forever", because larger durations could overflow the clock's time points.
constexpr std::chrono::hours kLongestWait{24 * 365};

Options withDefaults(Options options) {
  options.requestTimeout =
      std::min<std::chrono::milliseconds>(options.requestTimeout, kLongestWait);
  options.samePlaceFor = std::min<std::chrono::milliseconds>(options.samePlaceFor, kLongestWait);
  options.reconnectMax = std::min<std::chrono::milliseconds>(options.reconnectMax, kLongestWait);
  options.reconnectMin = std::min(options.reconnectMin, options.reconnectMax);
  options.reconnectMin = std::max(options.reconnectMin, std::chrono::milliseconds(1));
  options.reconnectMax = std::max(options.reconnectMax, options.reconnectMin);
  return options;
}

}  // namespace

ClientWorker::ClientWorker(Options options)
    : options_(withDefaults(std::move(options))),
      places_(socketPlaces(options_.socketPath)),
      ring_(options_.maxPendingMessages, options_.maxPendingBytes),
      process_(getpid()),
      wakeUp_(eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC)),
      watch_(places_),
      pause_(options_.reconnectMin) {
  // Block signals while the thread starts, because it inherits the signal mask. The program's
  // signals must go to the program's own threads.
  const platform::linux_::SignalsBlocked blocked;
  thread_.start([this] { run(); });
}

ClientWorker::~ClientWorker() {
  if (!isOwnProcess()) {
    // This is a child process after fork(). The thread exists only in the parent, and only the
    // parent may use the connection. Nothing can be joined here.
    thread_.abandon();
    return;
  }
  closing_.store(true, std::memory_order_relaxed);
  bool waiting = counters().pending > 0;
  {
    const MutexLock lock(mutex_);
    waiting = waiting || !lane_.empty();
  }
  if (waiting) flush(kFarewell);
  {
    const MutexLock lock(mutex_);
    endNow_ = true;
  }
  wake();
}

template <typename Content>
[[gnu::hot]] bool ClientWorker::push(const BasicMessageView<Content>& message) {
  // Relaxed is enough, because a program that sends while it destroys its client has a data race in
  // any case.
  const bool isClosing = closing_.load(std::memory_order_relaxed);
  switch (isClosing ? EncodeOutcome::kNoRoom : ring_.tryPush(message)) {
    case EncodeOutcome::kNoRoom:
      dropped_.fetch_add(1, std::memory_order_relaxed);
      return false;
    case EncodeOutcome::kNoWireForm:
      withoutForm_.fetch_add(1, std::memory_order_relaxed);
      return true;
    case EncodeOutcome::kDone:
      break;
  }
  // Wake the thread only if it sleeps. If it naps, it wakes up by itself.
  if (asleep_.load(std::memory_order_seq_cst) && asleep_.exchange(false)) wake();
  return true;
}

bool ClientWorker::send(const MessageView& message) { return push(message); }

[[gnu::hot]] bool ClientWorker::send(const EncodedMessageView& message) { return push(message); }

void ClientWorker::post(SessionOperation operation) {
  {
    const MutexLock lock(mutex_);
    wanted_.apply(operation);
    if (lane_.size() >= kMaxWaitingOperations) overflowed_ = true;
    if (!overflowed_) {
      lane_.push_back({ring_.tail(), std::move(operation)});
      lanePosition_.store(lane_.front().position, std::memory_order_release);
    }
  }
  wake();
}

bool ClientWorker::flush(std::chrono::milliseconds timeout) {
  // The connection handler called flush() on the worker's thread. That thread would have to do the
  // work of the flush while it waits.
  if (thread_.isCurrent()) return false;
  const TimePoint deadline =
      std::chrono::steady_clock::now() + std::min<std::chrono::milliseconds>(timeout, kLongestWait);
  if (!isOwnProcess()) return false;
  FlushTicket ticket = 0;
  {
    const MutexLock lock(mutex_);
    const std::uint64_t position = ring_.tail();
    // Flushes share a ticket if nothing was posted or sent between them. Otherwise flushes alone
    // could fill the lane.
    const bool shares = !lane_.empty() && lane_.back().position == position &&
                        std::holds_alternative<FlushTicket>(lane_.back().step);
    if (!shares) {
      lane_.push_back({position, ++flushAsked_});
      lanePosition_.store(lane_.front().position, std::memory_order_release);
    }
    ticket = flushAsked_;
  }
  if (turn_.tryLock()) {
    help(ticket, deadline);
    const bool leavesNothing = unanswered_ == 0 && !stream_.hasOutput() && !ring_.isReady();
    turn_.unlock();
    if (leavesNothing && isFlushDone(ticket)) return true;
  }
  wake();
  const MutexLock lock(mutex_);
  while (flushDone_ < ticket && !endNow_) {
    if (!flushed_.waitUntil(mutex_, deadline)) break;
  }
  return flushDone_ >= ticket;
}

bool ClientWorker::isFlushDone(FlushTicket ticket) {
  const MutexLock lock(mutex_);
  return flushDone_ >= ticket;
}

void ClientWorker::help(FlushTicket ticket, TimePoint deadline) {
  if (state_ != State::kReady) return;
  const TimePoint end = std::min(deadline, std::chrono::steady_clock::now() + kLongestHelp);
  for (;;) {
    sendAll();
    if (!stream_.isOpen() || isFlushDone(ticket)) return;
    if (std::chrono::steady_clock::now() >= end) return;
    std::array<pollfd, 2> polled{{stream_.polled(POLLIN), {wakeUp_.get(), POLLIN, 0}}};
    pollUntil(polled, end);
    // Another thread has woken the worker, which now waits for `turn_`.
    if (polled[1].revents != 0) return;
    if (polled[0].revents != 0 && !receive()) return;
  }
}

void ClientWorker::setConnectionHandler(std::function<void(bool)> handler) {
  {
    const MutexLock lock(mutex_);
    handler_ = handler ? std::make_shared<ConnectionHandler>(std::move(handler)) : nullptr;
    handlerIsNew_ = handler_ != nullptr;
  }
  wake();
}

std::string ClientWorker::socketPath() const {
  const MutexLock lock(mutex_);
  return shownPlace_;
}

Counters ClientWorker::counters() const {
  Counters counters;
  counters.dropped = dropped_.load(std::memory_order_relaxed);
  counters.acknowledged = acknowledged_.load(std::memory_order_acquire);
  const std::uint64_t withoutForm = withoutForm_.load(std::memory_order_relaxed);
  counters.refused = refused_.load(std::memory_order_acquire) + withoutForm;
  counters.lost = lost_.load(std::memory_order_acquire);
  counters.reconnects = reconnects_.load(std::memory_order_relaxed);
  // Read this counter last. Otherwise the sum of the others could exceed the accepted messages.
  counters.accepted = ring_.tail() + withoutForm;
  counters.pending = counters.accepted - counters.acknowledged - counters.refused - counters.lost;
  return counters;
}

void ClientWorker::wake() const {
  const std::uint64_t one = 1;
  // The write fails only if the thread has been woken already, or if there is no descriptor.
  static_cast<void>(!write(wakeUp_.get(), &one, sizeof one));
}

bool ClientWorker::isOwnProcess() const { return getpid() == process_; }

void ClientWorker::run() {
  platform::linux_::setUpThread("halvox-client");
  turn_.lock();
  while (!isEnding()) {
    giveUpWaitingIfOverflowed();
    notifyNewHandler();
    if (state_ == State::kAbsent && std::chrono::steady_clock::now() >= retryAt_) tryConnect();
    processStream();
    sendAll();
    if (mayFallAsleep()) sleepUntilSomethingHappens();
  }
  stream_ = {};
  turn_.unlock();
}

bool ClientWorker::isEnding() {
  const MutexLock lock(mutex_);
  return endNow_;
}

bool ClientWorker::mayFallAsleep() {
  nap_ = {};
  // A write has failed since the worker last looked at the connection. Nothing would end the sleep.
  if (state_ != State::kAbsent && !stream_.isOpen()) return false;
  if (!isWindowOpen()) return true;  // the socket or the deadline ends the sleep, not a producer
  nap_ = napLength();
  // Announce the sleep before looking at the ring for the last time. Either a producer sees the
  // announcement, or this thread sees the producer's message.
  if (nap_.count() == 0) asleep_.store(true, std::memory_order_seq_cst);
  const bool hasWork =
      ring_.isReady() || lanePosition_.load(std::memory_order_acquire) <= ring_.head();
  if (hasWork) asleep_.store(false, std::memory_order_seq_cst);
  return !hasWork;
}

std::chrono::milliseconds ClientWorker::napLength() const {
  const auto quiet = std::chrono::steady_clock::now() - lastMessage_;
  const bool isRunning = made_.running() > 0 || !openOperations_.empty();
  const bool mayBeWoken = !options_.isRealTime || !isRunning;
  if (mayBeWoken && quiet >= kNapsAfterMessage) return {};
  const auto share = std::chrono::duration_cast<std::chrono::milliseconds>(quiet / kNapShare);
  return std::clamp(share, kShortestNap, kLongestNap);
}

ClientWorker::TimePoint ClientWorker::nextDeadline() const {
  TimePoint deadline = TimePoint::max();
  if (state_ == State::kAbsent) deadline = retryAt_;
  if (state_ == State::kConnecting) deadline = handshakeEnds_;
  const TimePoint now = std::chrono::steady_clock::now();
  if (nap_.count() > 0) deadline = std::min(deadline, now + nap_);
  if (!wakeUp_) deadline = std::min(deadline, now + kPauseWithoutWakeUp);
  return deadline;
}

void ClientWorker::sleepUntilSomethingHappens() {
  // poll() ignores negative descriptors.
  std::array<pollfd, 3> polled{{{wakeUp_.get(), POLLIN, 0}, {watch_.fd(), POLLIN, 0}, {-1, 0, 0}}};
  if (stream_.isOpen()) {
    // While no call is open, wait only for the end of the connection, which poll() always reports.
    // If a thread in flush() sends a call in that time, the answer then wakes only that thread and
    // not this one.
    const bool expects = state_ == State::kConnecting || unanswered_ > 0;
    polled[2] = stream_.polled(expects ? POLLIN : 0);
  }
  const TimePoint deadline = nextDeadline();
  turn_.unlock();
  pollUntil(polled, deadline);
  turn_.lock();
  asleep_.store(false, std::memory_order_seq_cst);
  readable_ = (polled[2].revents & ~POLLOUT) != 0;
  if ((polled[0].revents & POLLIN) != 0) {
    std::uint64_t count = 0;
    static_cast<void>(!read(wakeUp_.get(), &count, sizeof count));
  }
  if (polled[1].revents != 0 && watch_.takeAppeared()) retryNow();
}

void ClientWorker::giveUpWaitingIfOverflowed() {
  std::uint64_t end = 0;
  {
    const MutexLock lock(mutex_);
    if (!overflowed_) return;
    for (const auto& entry : lane_) {
      const auto* ticket = std::get_if<FlushTicket>(&entry.step);
      if (ticket != nullptr) interruptedFlushes_.push_back(*ticket);
    }
    lane_.clear();
    lanePosition_.store(UINT64_MAX, std::memory_order_release);
    overflowed_ = false;
    made_ = wanted_;
    end = ring_.tail();
  }
  for (const Untaken& untaken : std::exchange(untaken_, {})) {
    const auto* frame = std::get_if<FrameRing::FrameNumber>(&untaken);
    if (frame != nullptr) giveUpMessage(*frame);
  }
  while (ring_.head() < end && ring_.isReady()) giveUpMessage(ring_.take());
  ring_.release();
  // Their results are in made_ now.
  for (OpenCall& call : open_) {
    if (call.kind == OpenCall::Kind::kOperation) call.kind = OpenCall::Kind::kOther;
  }
  openOperations_.clear();
  // The discarded operations may have changed any session. Connect again: a new connection makes
  // all sessions in their latest state.
  if (state_ != State::kAbsent) loseConnection();
}

void ClientWorker::giveUpMessage(FrameRing::FrameNumber frame) {
  ring_.drop(frame);
  lost_.fetch_add(1, std::memory_order_release);
}

}  // namespace halvox::client
