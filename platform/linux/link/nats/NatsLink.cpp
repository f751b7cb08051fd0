#include "platform/linux/link/nats/NatsLink.h"

#include <algorithm>
#include <span>
#include <system_error>
#include <utility>

#include "platform/linux/base/ThreadSetup.h"
#include "platform/linux/link/nats/NatsLog.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog(natsLogCategory, "NatsLink");
// How long close() waits for the threads of the library to end. They have no work left; if they
// need longer, one of them hangs.
constexpr std::chrono::milliseconds kLibraryEndTime{2000};
constexpr std::int64_t kDefaultSpin = -1;  // how long the library spins on its locks

// Returns an address without its user name and password. Sessions log the addresses.
std::string withoutUser(std::string_view server) {
  const std::size_t scheme = server.find("://");
  const std::size_t user = server.rfind('@');
  if (scheme == std::string_view::npos || user == std::string_view::npos) {
    return std::string(server);
  }
  return std::string(server.substr(0, scheme + 3)) + std::string(server.substr(user + 1));
}

}  // namespace

NatsLink::NatsLink(Configuration::Link options, const NatsEnvironment& environment)
    : options_(std::move(options)),
      dispatch_(environment.dispatch),
      publisher_(options_, environment.statistics, environment.spool, [this] {
        const MutexLock lock(mutex_);
        changed_.notifyAll();
      }) {
  // Open the library now. A connection would open it, too, but messages are made, and may be
  // destroyed, before the first connection.
  if (const natsStatus status = nats_Open(kDefaultSpin); status != NATS_OK) {
    kLog.error("cannot start the NATS client library: ", natsStatus_GetText(status),
               "; no server can be reached");
  }
}

NatsLink::~NatsLink() { static_cast<void>(close()); }

void NatsLink::resume() {
  // The store's thread must not wait for this link's lock: a thread that holds it may wait for the
  // store.
  publisher_.resume([link = weak_from_this(), &dispatch = dispatch_] {
    dispatch.asyncAfterOnBackgroundQueue(std::chrono::nanoseconds(0), [link] {
      const auto self = link.lock();
      if (!self) return;
      const MutexLock lock(self->mutex_);
      self->changed_.notifyAll();
    });
  });
  const MutexLock lock(mutex_);
  if (!publisher_.hasUnsent()) return;
  if (const std::string failure = provideThread(); !failure.empty()) {
    kLog.error("messages of an earlier run wait for the first session: ", failure);
  }
}

// Answers at once if messages can be kept: the spool takes the messages of the session whatever
// becomes of the servers. Returns false otherwise.
bool NatsLink::discoverLater(TLMReportingService::BackendsCallback& found) {
  Array servers;
  {
    const MutexLock lock(mutex_);
    // Callers that find a connection get its servers, which may have named others.
    if (closeBy_ || state_ == State::kConnected || !publisher_.canKeep()) return false;
    std::vector<Value> values;
    for (const std::string& server : options_.servers) values.emplace_back(withoutUser(server));
    servers = Array(std::span<const Value>(values));
    isAttemptWanted_ = true;
    nextAttempt_ = std::min(nextAttempt_, lastAttempt_ + kAttemptPause);
    // Without its thread the link keeps messages all the same. Each message tries to start it.
    static_cast<void>(provideThread());
    wakeThread();
  }
  dispatch_.asyncAfterOnBackgroundQueue(
      std::chrono::nanoseconds(0),
      [found = std::exchange(found, nullptr), servers] { found(servers); });
  return true;
}

void NatsLink::discover(TLMReportingService::BackendsCallback found) {
  if (discoverLater(found)) return;
  std::uint64_t waiter = 0;
  std::string failure;
  {
    const MutexLock lock(mutex_);
    const bool isRefused = closeBy_.has_value();
    // Start the thread only when a session looks for back-ends, because a service without sessions
    // needs no link.
    if (!isRefused) failure = provideThread();
    if (!isRefused && failure.empty()) {
      wakeThread();
      // Do not call `found` here. It must run later, on the link's thread, because the session logs
      // that it waits for back-ends only after discover() has returned.
      if (state_ == State::kConnected) return answers_.push_back({std::move(found), servers_});
      waiter = ++lastWaiter_;
      waiters_.push_back({waiter, std::exchange(found, nullptr)});
    }
  }
  if (!failure.empty()) kLog.error("a session starts without NATS servers: ", failure);
  if (waiter == 0) {
    // The link's thread does not run. Call back on the background queue.
    return dispatch_.asyncAfterOnBackgroundQueue(
        std::chrono::nanoseconds(0), [found = std::move(found)] { found(std::nullopt); });
  }
  // Answer this caller after kDiscoveryTime even if the attempt to connect has not ended. The
  // attempt cannot be cancelled.
  dispatch_.asyncAfterOnBackgroundQueue(kDiscoveryTime, [link = weak_from_this(), waiter] {
    if (const auto self = link.lock()) self->expire(waiter);
  });
}

void NatsLink::expire(std::uint64_t waiter) {
  TLMReportingService::BackendsCallback found;
  {
    const MutexLock lock(mutex_);
    const auto place = std::ranges::find(waiters_, waiter, &Waiter::id);
    // If the caller is not in the list, it has been answered already.
    if (place == waiters_.end()) return;
    found = std::move(place->found);
    waiters_.erase(place);
  }
  found(std::nullopt);
}

std::optional<Error> NatsLink::refusal(std::size_t bytes) {
  if (closeBy_) return refusedByLink("the service is ending");
  if (maxPayload_ > 0 && bytes > maxPayload_) {
    return refusedByLink("the message has " + std::to_string(bytes) +
                         " bytes; the NATS server accepts at most " + std::to_string(maxPayload_));
  }
  if (publisher_.canKeep()) {
    static_cast<void>(provideThread());
    return std::nullopt;
  }
  // If an attempt to connect has just failed, refuse the message. The sender then gets the error at
  // once, not after another time-out.
  if (state_ == State::kIdle && !lastFailure_.empty() &&
      std::chrono::steady_clock::now() < nextAttempt_) {
    return refusedByLink("cannot connect to a NATS server: " + lastFailure_);
  }
  if (const std::string failure = provideThread(); !failure.empty()) return refusedByLink(failure);
  return std::nullopt;
}

std::optional<Error> NatsLink::refuseAtEnd() {
  {
    const MutexLock lock(mutex_);
    if (!closeBy_) return std::nullopt;
  }
  publisher_.countReceived();
  publisher_.refuse(OutgoingMessage());
  return refusedByLink("the service is ending");
}

std::optional<Error> NatsLink::send(OutgoingMessage message) {
  publisher_.countReceived();
  std::optional<Error> error;
  {
    const MutexLock lock(mutex_);
    error = refusal(message.bytes);
  }
  // Call take() without this lock, because it may wait for the store. At the end of the link, it
  // refuses messages itself.
  if (!error) error = publisher_.take(message);
  if (!error) {
    bool mustKeepLater = false;
    {
      const MutexLock lock(mutex_);
      wakeThread();
      mustKeepLater =
          !hasConnection() && publisher_.canKeep() && !std::exchange(isKeptLater_, true);
    }
    if (mustKeepLater) keepLater();
    return std::nullopt;
  }
  // Call refuse() without the lock. It may end a flush, whose callback may send.
  publisher_.refuse(message);
  return error;
}

// Keeps the messages that wait for the first connection, if it takes long. The link's thread cannot
// do that, because it is in the library until the attempt ends.
void NatsLink::keepLater() {
  dispatch_.asyncAfterOnBackgroundQueue(OutgoingQueue::kMemoryTime, [link = weak_from_this()] {
    const auto self = link.lock();
    if (!self) return;
    {
      const MutexLock lock(self->mutex_);
      self->isKeptLater_ = false;
      // From now on the thread does it.
      if (self->hasConnection()) return;
    }
    if (self->publisher_.canKeep()) self->publisher_.keep();
  });
}

bool NatsLink::close() {
  {
    const MutexLock lock(mutex_);
    // This is not the first call. The thread is still joinable if it hung at the end of the first
    // call.
    if (closeBy_) return !thread_.joinable();
    const Time now = std::chrono::steady_clock::now();
    closeBy_ = now + kCloseTime;
    // An attempt to connect may hang and gets only a short time. A connection always ends within a
    // known time.
    leaveBy_ =
        state_ == State::kConnecting ? now + kAttemptEndTime : *closeBy_ + kConnectionEndTime;
    publisher_.beginEnd();
    changed_.notifyAll();
  }
  // If the thread hangs in the library, it holds the lock of the connection. Neither the thread nor
  // the connection can be destroyed then.
  if (!awaitThread()) {
    kLog.notice("a NATS server does not answer; closing without it, unsent messages are ",
                publisher_.canKeep() ? "kept" : "dropped");
    giveUpRest();
    keepForEver();
    return false;
  }
  // When the library has ended, it calls no more callbacks. If it does not end, a callback may
  // still run, and this object must stay.
  if (nats_CloseAndWait(kLibraryEndTime.count()) == NATS_OK) return true;
  kLog.error("the NATS client library did not end within ", kLibraryEndTime.count(),
             " ms; leaving it running until the process ends");
  keepForEver();
  return true;
}

// Returns false if the thread still runs at leaveBy_. The thread changes leaveBy_ itself: to a
// later time before work that ends within a known time, and to an earlier one before work that may
// hang.
bool NatsLink::awaitThread() {
  {
    const MutexLock lock(mutex_);
    if (!thread_.joinable()) return true;
    // join() has no time limit.
    while (!hasThreadEnded_ && std::chrono::steady_clock::now() < leaveBy_) {
      changed_.waitUntil(mutex_, leaveBy_);
    }
    if (!hasThreadEnded_) return false;
  }
  thread_.join();
  return true;
}

// If the thread hangs in the library, this function does the part of end() that needs no
// connection.
void NatsLink::giveUpRest() {
  {
    const MutexLock lock(mutex_);
    if (state_ == State::kConnected) state_ = State::kAway;
  }
  publisher_.abandonAll();
  answerWaiters();
}

void NatsLink::keepForEver() {
  static auto* const kept = new std::vector<std::shared_ptr<NatsLink>>;  // never destroyed
  if (auto self = weak_from_this().lock()) kept->push_back(std::move(self));
}

// Starts the thread unless it runs. Returns why it cannot be started; empty on success.
std::string NatsLink::provideThread() {
  if (thread_.joinable()) return {};
  try {
    thread_ = std::thread([this] { run(); });
    return {};
  } catch (const std::system_error& error) {
    return std::string("cannot start the thread of the NATS link: ") + error.what();
  }
}

void NatsLink::wakeThread() {
  // Wake the thread only if it waits. If it works, it looks for the next step by itself.
  if (!std::exchange(isIdle_, false)) return;
  changed_.notifyAll();
}

bool NatsLink::hasConnection() const {
  return state_ != State::kIdle && state_ != State::kConnecting;
}

// Returns true if a caller or a message needs a connection.
bool NatsLink::isNeeded() {
  return !waiters_.empty() || isAttemptWanted_ || publisher_.hasUnsent();
}

// Returns true if close() was called and no work or no time remains.
bool NatsLink::isAtEnd(Time now) {
  if (!closeBy_) return false;
  return !hasConnection() || state_ == State::kLost || publisher_.isDone() || now >= *closeBy_;
}

NatsLink::Step NatsLink::nextStep(Time now) {
  // Check for the end before all other steps, because close() waits only for a limited time.
  if (isAtEnd(now)) return Step::kEnd;
  if (!answers_.empty()) return Step::kCallBack;
  if (state_ == State::kLost) return Step::kDrop;
  // Abandon overdue messages before connecting. A flush may wait for them, and connecting can take
  // seconds.
  if (const auto deadline = publisher_.firstDeadline(); deadline && now >= *deadline) {
    return Step::kAbandon;
  }
  // Keep messages before connecting, too, because a kill must not lose them meanwhile.
  if (const auto time = publisher_.keepTime(); time && now >= *time) return Step::kKeep;
  if (!hasConnection()) return now >= nextAttempt_ && isNeeded() ? Step::kConnect : Step::kWait;
  return state_ == State::kConnected ? nextConnectedStep(now) : Step::kWait;
}

NatsLink::Step NatsLink::nextConnectedStep(Time now) {
  if (!waiters_.empty()) return Step::kAnswer;
  if (publisher_.canPublish(now)) return Step::kPublish;
  return publisher_.mustRefill(now) ? Step::kRefill : Step::kWait;
}

// Returns the time at which nextStep() can return another step without any other change, if it has
// just returned kWait for `now`.
std::optional<NatsLink::Time> NatsLink::nextTime(Time now) {
  std::optional<Time> next = closeBy_;
  const auto consider = [&next](std::optional<Time> time) {
    if (time) next = std::min(next.value_or(*time), *time);
  };
  consider(publisher_.firstDeadline());
  consider(publisher_.keepTime());
  if (state_ == State::kConnected) {
    consider(publisher_.probeTime());
    // A read that is due already waits for something else, such as acknowledgements.
    if (const auto time = publisher_.refillTime(); time && *time > now) consider(time);
  }
  if (!hasConnection() && isNeeded()) consider(nextAttempt_);
  return next;
}

void NatsLink::waitForChange(Time now) {
  isIdle_ = true;
  if (const auto time = nextTime(now)) {
    changed_.waitUntil(mutex_, *time);
  } else {
    changed_.wait(mutex_);
  }
  isIdle_ = false;
}

void NatsLink::run() {
  setUpThread("com.tarno.halvox.link", ThreadPriority::kUtility);
  while (true) {
    Step step = Step::kWait;
    {
      const MutexLock lock(mutex_);
      const Time now = std::chrono::steady_clock::now();
      step = nextStep(now);
      if (step == Step::kWait) waitForChange(now);
    }
    // Perform the step without the lock, because most steps call the library and some wait for a
    // server.
    if (!perform(step)) return;
  }
}

bool NatsLink::perform(Step step) {
  switch (step) {
    case Step::kWait:
      break;
    case Step::kCallBack:
      callBackAnswers();
      break;
    case Step::kAnswer:
      answerWaiters();
      break;
    case Step::kConnect:
      connect();
      break;
    case Step::kKeep:
      publisher_.keep();
      break;
    case Step::kPublish:
      publisher_.publishNext();
      break;
    case Step::kRefill:
      publisher_.refill();
      break;
    case Step::kAbandon:
      publisher_.abandonOverdue();
      break;
    case Step::kDrop:
      dropConnection();
      break;
    case Step::kEnd:
      end();
      return false;
  }
  return true;
}

void NatsLink::end() {
  {
    // While the library tries to reconnect, it holds the lock of the connection, and closing the
    // connection may hang. In that case dropConnection() gets only a short time.
    const MutexLock lock(mutex_);
    if (state_ != State::kConnected) leaveBy_ = std::chrono::steady_clock::now() + kAttemptEndTime;
    changed_.notifyAll();
  }
  // First let the library's threads finish their work, then close the connection.
  drain();
  dropConnection();
  answerWaiters();
  nats_ReleaseThreadMemory();
  const MutexLock lock(mutex_);
  hasThreadEnded_ = true;
  changed_.notifyAll();
}

// Calls back all callers of discover(), with the servers or, if none is connected, with
// std::nullopt.
void NatsLink::answerWaiters() {
  std::vector<Waiter> waiters;
  std::optional<Array> servers;
  {
    const MutexLock lock(mutex_);
    waiters.swap(waiters_);
    if (state_ == State::kConnected) servers = servers_;
  }
  callBackAnswers();
  // Call the callbacks without the lock, because a callback may call discover() or send() again.
  for (const Waiter& waiter : waiters) waiter.found(servers);
}

void NatsLink::callBackAnswers() {
  std::vector<Answer> answers;
  {
    const MutexLock lock(mutex_);
    answers.swap(answers_);
  }
  for (const Answer& answer : answers) answer.found(answer.servers);
}

}  // namespace halvox::platform::linux_
