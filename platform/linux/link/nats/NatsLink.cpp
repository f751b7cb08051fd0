#include "platform/linux/link/nats/NatsLink.h"

#include <algorithm>
#include <system_error>
#include <utility>

#include "platform/linux/base/ThreadSetup.h"
#include "platform/linux/link/nats/NatsLog.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog(natsLogCategory, "NatsLink");
constexpr std::chrono::milliseconds kLibraryEndTime{2000};
constexpr std::int64_t kDefaultSpin = -1;
constexpr std::string_view kErrorDomain = "com.tarno.halvox.link";

Error refuse(std::string description) {
  return {.domain = std::string(kErrorDomain), .code = 1, .description = std::move(description)};
}

}  // namespace

NatsLink::NatsLink(Configuration::Link options, const NatsEnvironment& environment)
    : options_(std::move(options)),
      dispatch_(environment.dispatch),
      statistics_(environment.statistics),
      received_(statistics_.counter(kNatsPiece, "received")),
      acknowledged_(statistics_.counter(kNatsPiece, "acknowledged")),
      notAcknowledged_(statistics_.counter(kNatsPiece, "not acknowledged")),
      publishedAgain_(statistics_.counter(kNatsPiece, "published again")) {
  // Connecting would open the library, too, but the first message is made, and may be destroyed,
  // before that.
  if (const natsStatus status = nats_Open(kDefaultSpin); status != NATS_OK) {
    kLog.error("the client library of the link does not start: ", natsStatus_GetText(status));
  }
}

NatsLink::~NatsLink() { (void)close(); }

void NatsLink::discover(TLMReportingService::BackendsCallback found) {
  std::uint64_t waiter = 0;
  std::string failure;
  {
    const MutexLock lock(mutex_);
    const bool isRefused = closeBy_.has_value();
    if (!isRefused) failure = provideThread();
    if (!isRefused && failure.empty()) {
      wakeThread();
      if (isConnected_) return answers_.push_back({std::move(found), servers_});
      waiter = ++lastWaiter_;
      waiters_.push_back({waiter, std::exchange(found, nullptr)});
    }
  }
  if (!failure.empty()) kLog.error("no server of the link is looked for: ", failure);
  if (waiter == 0) {
    // Without the thread that answers, the background queue does.
    return dispatch_.asyncAfterOnBackgroundQueue(
        std::chrono::nanoseconds(0), [found = std::move(found)] { found(std::nullopt); });
  }
  dispatch_.asyncAfterOnBackgroundQueue(kDiscoveryTime, [link = weak_from_this(), waiter] {
    if (const auto self = link.lock()) self->expire(waiter);
  });
}

void NatsLink::expire(std::uint64_t waiter) {
  TLMReportingService::BackendsCallback found;
  {
    const MutexLock lock(mutex_);
    const auto place = std::ranges::find(waiters_, waiter, &Waiter::id);
    if (place == waiters_.end()) return;
    found = std::move(place->found);
    waiters_.erase(place);
  }
  found(std::nullopt);
}

std::optional<Error> NatsLink::refusal(const OutgoingMessage& message) {
  if (closeBy_) return refuse("the service is ending");
  if (maxPayload_ > 0 && message.bytes > maxPayload_) {
    return refuse("a message of " + std::to_string(message.bytes) + " bytes is more than the " +
                  std::to_string(maxPayload_) + " that the server takes");
  }
  if (queuedBytes_ + message.bytes > kQueueBytes) {
    return refuse("no room: " + std::to_string(queue_.size()) + " messages wait for the server");
  }
  // Where the last attempt failed a moment ago, the next message need not wait for another.
  if (!connection_ && !lastFailure_.empty() && std::chrono::steady_clock::now() < nextAttempt_) {
    return refuse("no server was reached: " + lastFailure_);
  }
  if (const std::string failure = provideThread(); !failure.empty()) return refuse(failure);
  return std::nullopt;
}

void NatsLink::countRefused() { statistics_.counter(kNatsPiece, "failed: refused").add(); }

std::optional<Error> NatsLink::refuseAtEnd() {
  {
    const MutexLock lock(mutex_);
    if (!closeBy_) return std::nullopt;
  }
  received_.add();
  countRefused();
  return refuse("the service is ending");
}

std::optional<Error> NatsLink::send(OutgoingMessage message) {
  received_.add();
  std::optional<Error> error;
  {
    const MutexLock lock(mutex_);
    error = refusal(message);
    if (!error) {
      queuedBytes_ += message.bytes;
      queue_.push_back(std::move(message));
      wakeThread();
      return std::nullopt;
    }
  }
  countRefused();
  if (message.ledger) message.ledger->resolve(message.number, AckOutcome::kRefused);
  return error;
}

bool NatsLink::close() {
  {
    const MutexLock lock(mutex_);
    if (closeBy_) return !thread_.joinable();
    const Time now = std::chrono::steady_clock::now();
    closeBy_ = now + kCloseTime;
    leaveBy_ = isConnecting_ ? now + kAttemptEndTime : *closeBy_ + kConnectionEndTime;
    changed_.notifyAll();
  }
  if (!awaitThread()) {
    kLog.notice("the link ends without waiting for a server any longer");
    giveUpRest();
    keepForEver();
    return false;
  }
  // After this no callback of the library runs; if it does not end, they may still find this here.
  if (nats_CloseAndWait(kLibraryEndTime.count()) == NATS_OK) return true;
  kLog.error("the client library of the link did not end in time");
  keepForEver();
  return true;
}

// False when it is still busy when its time is over.
bool NatsLink::awaitThread() {
  {
    const MutexLock lock(mutex_);
    if (!thread_.joinable()) return true;
    while (!hasThreadEnded_ && std::chrono::steady_clock::now() < leaveBy_) {
      changed_.waitUntil(mutex_, leaveBy_);
    }
    if (!hasThreadEnded_) return false;
  }
  thread_.join();
  return true;
}

// Does for the thread what it does at its end, but for the connection.
void NatsLink::giveUpRest() {
  std::vector<PendingAcks::Entry> lost;
  std::deque<OutgoingMessage> unsent;
  {
    const MutexLock lock(mutex_);
    isConnected_ = false;
    lost = pending_.takeAll();
    unsent.swap(queue_);
  }
  abandon(lost, "the connection ended");
  fail(unsent, "the service ended");
  answerWaiters();
}

void NatsLink::keepForEver() {
  static auto* const kept = new std::vector<std::shared_ptr<NatsLink>>;  // never destroyed
  if (auto self = weak_from_this().lock()) kept->push_back(std::move(self));
}

// Why there is none; empty when there is one.
std::string NatsLink::provideThread() {
  if (thread_.joinable()) return {};
  try {
    thread_ = std::thread([this] { run(); });
    return {};
  } catch (const std::system_error& error) {
    return std::string("no thread for the link: ") + error.what();
  }
}

void NatsLink::wakeThread() {
  if (!std::exchange(isIdle_, false)) return;
  changed_.notifyAll();
}

// Whether there is nothing left to do after close(), or no time.
bool NatsLink::isAtEnd(Time now) {
  if (!closeBy_) return false;
  const bool isAllDone = queue_.empty() && pending_.size() == 0;
  return !connection_ || isLost_ || isAllDone || now >= *closeBy_;
}

NatsLink::Step NatsLink::nextStepConnected(Time now) {
  if (pending_.size() == 0) flow_ = Flow::kFlowing;
  if (flow_ == Flow::kProbing) return Step::kWait;
  if (flow_ == Flow::kHolding) return now >= probeAt_ ? Step::kProbe : Step::kWait;
  if (pending_.needsAgain()) return pending_.hasAgain() ? Step::kSend : Step::kWait;
  return !queue_.empty() && !isWindowFull_ ? Step::kSend : Step::kWait;
}

NatsLink::Step NatsLink::nextStep(Time now) {
  if (isWindowFull_ && pending_.isHalfFree()) isWindowFull_ = false;
  if (isAtEnd(now)) return Step::kEnd;
  if (!answers_.empty()) return Step::kTell;
  if (isLost_) return Step::kDrop;
  if (const auto deadline = pending_.firstDeadline(); deadline && now >= *deadline) {
    return Step::kGiveUp;
  }
  if (isConnected_ && !waiters_.empty()) return Step::kAnswer;
  if (!connection_) {
    const bool isNeeded = !waiters_.empty() || !queue_.empty();
    return isNeeded && now >= nextAttempt_ ? Step::kConnect : Step::kWait;
  }
  return isConnected_ ? nextStepConnected(now) : Step::kWait;
}

// When there is something to do even if nothing changes.
std::optional<NatsLink::Time> NatsLink::nextTime() {
  std::optional<Time> next = closeBy_;
  const auto consider = [&next](Time time) { next = std::min(next.value_or(time), time); };
  if (const auto deadline = pending_.firstDeadline()) consider(*deadline);
  if (isConnected_ && flow_ == Flow::kHolding) consider(probeAt_);
  if (!connection_ && (!waiters_.empty() || !queue_.empty())) consider(nextAttempt_);
  return next;
}

void NatsLink::waitForChange() {
  isIdle_ = true;
  if (const auto time = nextTime()) {
    changed_.waitUntil(mutex_, *time);
  } else {
    changed_.wait(mutex_);
  }
  isIdle_ = false;
}

void NatsLink::run() {
  setUpThread("com.tarno.halvox.link", QualityOfService::kUtility);
  while (true) {
    Step step = Step::kWait;
    {
      const MutexLock lock(mutex_);
      step = nextStep(std::chrono::steady_clock::now());
      if (step == Step::kWait) waitForChange();
    }
    switch (step) {
      case Step::kWait:
        break;
      case Step::kTell:
        tellAnswers();
        break;
      case Step::kAnswer:
        answerWaiters();
        break;
      case Step::kConnect:
        connect();
        break;
      case Step::kProbe:
        probe();
        break;
      case Step::kSend:
        publishSome();
        break;
      case Step::kGiveUp:
        giveUpOverdue();
        break;
      case Step::kDrop:
        dropConnection();
        break;
      case Step::kEnd:
        end();
        return;
    }
  }
}

void NatsLink::end() {
  {
    // A library that looks for its server lets nobody close the connection in between.
    const MutexLock lock(mutex_);
    if (!isConnected_) leaveBy_ = std::chrono::steady_clock::now() + kAttemptEndTime;
    changed_.notifyAll();
  }
  drain();
  dropConnection();
  answerWaiters();
  nats_ReleaseThreadMemory();
  const MutexLock lock(mutex_);
  hasThreadEnded_ = true;
  changed_.notifyAll();
}

// Those that wait for servers learn of them, or that there are none.
void NatsLink::answerWaiters() {
  std::vector<Waiter> waiters;
  std::optional<Array> servers;
  {
    const MutexLock lock(mutex_);
    waiters.swap(waiters_);
    if (isConnected_) servers = servers_;
  }
  tellAnswers();
  for (const Waiter& waiter : waiters) waiter.found(servers);
}

// Those that asked while there was a server.
void NatsLink::tellAnswers() {
  std::vector<Answer> answers;
  {
    const MutexLock lock(mutex_);
    answers.swap(answers_);
  }
  for (const Answer& answer : answers) answer.found(answer.servers);
}

}  // namespace halvox::platform::linux_
