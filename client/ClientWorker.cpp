#include "client/ClientWorker.h"

#include <algorithm>
#include <array>
#include <utility>

#include <sys/eventfd.h>

#include "platform/linux/base/ThreadSetup.h"

namespace halvox::client {
namespace {

using platform::linux_::MutexLock;

constexpr std::size_t kMaxWaitingOperations = 8192;
constexpr std::chrono::seconds kFarewell{1};
// How often to look for work if there is no descriptor through which producers can wake the thread.
constexpr std::chrono::milliseconds kPauseWithoutWakeUp{50};
// Stands for "wait for ever": larger durations could overflow the clock's time points.
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
      wakeUp_(eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC)),
      watch_(places_),
      pause_(options_.reconnectMin) {
  // The program's signals must go to its own threads, and a thread inherits the signal mask.
  const platform::linux_::SignalsBlocked blocked;
  thread_ = std::jthread([this] { run(); });
}

ClientWorker::~ClientWorker() {
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

bool ClientWorker::send(OutgoingMessage&& message) {
  // Relaxed is enough: a program that sends while it destroys its client has a race of its own.
  if (closing_.load(std::memory_order_relaxed) || !ring_.tryPush(std::move(message))) {
    dropped_.fetch_add(1, std::memory_order_relaxed);
    return false;
  }
  // Wake the thread only if it sleeps for lack of work. That saves a system call for each message.
  if (asleep_.load(std::memory_order_seq_cst) && asleep_.exchange(false)) wake();
  return true;
}

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
  // The connection handler runs on the thread that would have to do the work.
  if (std::this_thread::get_id() == thread_.get_id()) return false;
  const TimePoint deadline =
      std::chrono::steady_clock::now() + std::min<std::chrono::milliseconds>(timeout, kLongestWait);
  const MutexLock lock(mutex_);
  const std::uint64_t position = ring_.tail();
  // Flushes with nothing between them share a ticket. Otherwise they could fill the lane.
  const bool shares = !lane_.empty() && lane_.back().position == position &&
                      std::holds_alternative<FlushTicket>(lane_.back().step);
  if (!shares) {
    lane_.push_back({position, ++flushAsked_});
    lanePosition_.store(lane_.front().position, std::memory_order_release);
  }
  const FlushTicket ticket = flushAsked_;
  wake();
  while (flushDone_ < ticket && !endNow_) {
    if (!flushed_.waitUntil(mutex_, deadline)) break;
  }
  return flushDone_ >= ticket;
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
  counters.refused = refused_.load(std::memory_order_acquire);
  counters.lost = lost_.load(std::memory_order_acquire);
  counters.reconnects = reconnects_.load(std::memory_order_relaxed);
  // Read last. Otherwise more messages could seem settled than accepted.
  counters.accepted = ring_.tail();
  counters.pending = counters.accepted - counters.acknowledged - counters.refused - counters.lost;
  return counters;
}

void ClientWorker::wake() const {
  const std::uint64_t one = 1;
  // Fails only if the thread has been woken already, or if there is no descriptor.
  static_cast<void>(!write(wakeUp_.get(), &one, sizeof one));
}

void ClientWorker::run() {
  platform::linux_::setUpThread("halvox-client");
  while (!isEnding()) {
    giveUpWaitingIfOverflowed();
    notifyNewHandler();
    if (state_ == State::kAbsent && std::chrono::steady_clock::now() >= retryAt_) tryConnect();
    processBus();
    while (isWindowOpen() && sendNext()) {
    }
    if (mayFallAsleep()) sleepUntilSomethingHappens();
  }
  bus_.reset();
}

bool ClientWorker::isEnding() {
  const MutexLock lock(mutex_);
  return endNow_;
}

bool ClientWorker::mayFallAsleep() {
  if (!isWindowOpen()) return true;  // the socket or the clock wakes, not a producer
  asleep_.store(true, std::memory_order_seq_cst);
  const bool hasWork =
      ring_.isReady() || lanePosition_.load(std::memory_order_acquire) <= ring_.head();
  if (hasWork) asleep_.store(false, std::memory_order_seq_cst);
  return !hasWork;
}

ClientWorker::TimePoint ClientWorker::nextDeadline() const {
  TimePoint deadline = TimePoint::max();
  if (state_ == State::kAbsent) deadline = retryAt_;
  if (state_ == State::kConnecting) deadline = handshakeEnds_;
  std::uint64_t busDeadline = UINT64_MAX;  // microseconds of the same clock
  if (bus_ && sd_bus_get_timeout(bus_.get(), &busDeadline) >= 0 && busDeadline != UINT64_MAX) {
    deadline = std::min(deadline, TimePoint(std::chrono::microseconds(busDeadline)));
  }
  if (!wakeUp_) {
    deadline = std::min(deadline, std::chrono::steady_clock::now() + kPauseWithoutWakeUp);
  }
  return deadline;
}

void ClientWorker::sleepUntilSomethingHappens() {
  // poll() ignores negative descriptors.
  std::array<pollfd, 3> polled{{{wakeUp_.get(), POLLIN, 0}, {watch_.fd(), POLLIN, 0}, {-1, 0, 0}}};
  if (bus_) {
    const int events = sd_bus_get_events(bus_.get());
    polled[2] = {sd_bus_get_fd(bus_.get()), static_cast<short>(std::max(events, 0)), 0};
  }
  const TimePoint deadline = nextDeadline();
  timespec remaining{};
  if (deadline != TimePoint::max()) {
    const auto left = std::max(deadline - std::chrono::steady_clock::now(),
                               std::chrono::steady_clock::duration::zero());
    const auto seconds = std::chrono::duration_cast<std::chrono::seconds>(left);
    remaining = {.tv_sec = seconds.count(), .tv_nsec = (left - seconds).count()};
  }
  ppoll(polled.data(), polled.size(), deadline == TimePoint::max() ? nullptr : &remaining, nullptr);
  asleep_.store(false, std::memory_order_seq_cst);
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
  while (ring_.head() < end && ring_.isReady()) {
    ring_.pop();
    lost_.fetch_add(1, std::memory_order_release);
  }
  // The lost operations may have changed any session. Connecting again makes the sessions as they
  // are wanted now.
  if (state_ != State::kAbsent) loseConnection();
}

}  // namespace halvox::client
