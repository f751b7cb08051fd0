#include <algorithm>
#include <span>
#include <utility>

#include "platform/linux/link/nats/NatsLink.h"
#include "platform/linux/link/nats/NatsLog.h"
#include "platform/linux/link/nats/NatsStream.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog(natsLogCategory, "NatsLink");

// The time limits of one attempt. The library tries one server after the other, and a server that
// accepts the connection and then stays silent takes its whole time-out. All servers together get
// kServersTime, and looking for the stream takes up to two requests. The sum is 7.5 seconds. The
// attempt therefore ends before the callers of discover() give up (kDiscoveryTime).
constexpr std::chrono::milliseconds kServerTime{2000};
constexpr std::chrono::milliseconds kShortestServerTime{100};
constexpr std::chrono::milliseconds kServersTime{6000};
constexpr std::chrono::milliseconds kRequestTime{750};
static_assert(kServersTime + 2 * kRequestTime < NatsLink::kDiscoveryTime);
// A server that does not read for this long counts as disconnected. close() may have to wait for
// one write.
constexpr std::chrono::milliseconds kWriteTime{2000};
// The pause is short, to reconnect quickly after a restart of a server. The jitter keeps the
// services of a fleet from reconnecting at the same moment.
constexpr std::chrono::milliseconds kReconnectPause{250};
constexpr std::chrono::milliseconds kReconnectJitter{250};
// With these pings, the library notices within a minute that a server has vanished without closing
// the connection. More frequent pings would wake the service more often and gain little, because a
// missing acknowledgement shows the loss sooner.
constexpr std::chrono::milliseconds kPingPause{20'000};
constexpr int kLostPings = 2;
constexpr int kForEver = -1;

// The library must not buffer messages while it has no server. They would overtake the messages
// that were sent but not acknowledged; see NatsPublisher. 0 disables the buffer, although the
// library documents that 0 stands for its default size. With 1 byte it buffers a whole message.
constexpr int kReconnectBufferBytes = 0;
constexpr std::chrono::milliseconds kDrainTime{1000};
static_assert(2 * kDrainTime + kWriteTime < NatsLink::kConnectionEndTime);

Array serversOf(natsConnection* connection) {
  char** urls = nullptr;
  int count = 0;
  if (natsConnection_GetServers(connection, &urls, &count) != NATS_OK) return {};
  std::vector<Value> values;
  for (char* const url : std::span(urls, static_cast<std::size_t>(count))) {
    values.emplace_back(std::string_view(url));
    // The library allocates the list and its texts with malloc().
    std::free(url);
  }
  std::free(static_cast<void*>(urls));
  return Array(std::span<const Value>(values));
}

natsStatus secure(natsOptions* options, const Configuration::Link& link) {
  if (!link.credentials.empty()) {
    const natsStatus status =
        natsOptions_SetUserCredentialsFromFiles(options, link.credentials.c_str(), nullptr);
    if (status != NATS_OK) return status;
  }
  if (!link.tls) return NATS_OK;
  const Configuration::Link::Tls& tls = *link.tls;
  natsStatus status = natsOptions_SetSecure(options, true);
  if (status == NATS_OK && !tls.ca.empty()) {
    status = natsOptions_LoadCATrustedCertificates(options, tls.ca.c_str());
  }
  if (status == NATS_OK && !tls.certificate.empty()) {
    status = natsOptions_LoadCertificatesChain(options, tls.certificate.c_str(), tls.key.c_str());
  }
  // Skip verification only if the configuration says so. The library checks certificates and names
  // by default.
  if (status == NATS_OK && !tls.verify) {
    status = natsOptions_SkipServerVerification(options, true);
  }
  return status;
}

}  // namespace

natsStatus NatsLink::configure(natsOptions* options) {
  std::vector<const char*> urls;
  for (const std::string& server : options_.servers) urls.push_back(server.c_str());
  const auto servers = static_cast<std::int64_t>(std::max<std::size_t>(urls.size(), 1));
  const std::int64_t timeout = std::min(kServerTime.count(), kServersTime.count() / servers);
  const auto away = [](natsConnection* connection, void* link) {
    static_cast<NatsLink*>(link)->onAway(connection);
  };
  const auto available = [](natsConnection* connection, void* link) {
    static_cast<NatsLink*>(link)->onAvailable(connection);
  };
  const auto closed = [](natsConnection* connection, void* link) {
    static_cast<NatsLink*>(link)->onClosed(connection);
  };
  // Replace the default handler, which prints to stderr. The acknowledgements already show the
  // effects of these errors.
  const auto ignore = [](natsConnection*, natsSubscription*, natsStatus, void*) {};
  for (const natsStatus status :
       {natsOptions_SetServers(options, urls.data(), static_cast<int>(urls.size())),
        natsOptions_SetName(options, "halvox-reportingd"),
        natsOptions_SetTimeout(options,
                               std::max<std::int64_t>(timeout, kShortestServerTime.count())),
        natsOptions_SetAllowReconnect(options, true),
        natsOptions_SetMaxReconnect(options, kForEver),
        natsOptions_SetReconnectWait(options, kReconnectPause.count()),
        natsOptions_SetReconnectJitter(options, kReconnectJitter.count(), kReconnectJitter.count()),
        natsOptions_SetReconnectBufSize(options, kReconnectBufferBytes),
        natsOptions_SetWriteDeadline(options, kWriteTime.count()),
        natsOptions_SetPingInterval(options, kPingPause.count()),
        natsOptions_SetMaxPingsOut(options, kLostPings),
        natsOptions_SetDisconnectedCB(options, away, this),
        natsOptions_SetReconnectedCB(options, available, this),
        natsOptions_SetDiscoveredServersCB(options, available, this),
        natsOptions_SetErrorHandler(options, ignore, nullptr),
        natsOptions_SetClosedCB(options, closed, this)}) {
    if (status != NATS_OK) return status;
  }
  return secure(options, options_);
}

// Connects and finds the stream. Returns why it failed; empty on success. After a failure the
// caller must close `connection` if there is one.
std::string NatsLink::open(NatsConnection& connection, JetStreamContext& context) {
  NatsOptionsHandle options;
  natsStatus status = natsOptions_Create(options.out());
  if (status == NATS_OK) status = configure(options.get());
  if (status == NATS_OK) status = natsConnection_Connect(connection.out(), options.get());
  if (status != NATS_OK) return describe(status);
  jsOptions streaming;
  jsOptions_Init(&streaming);
  streaming.Wait = kRequestTime.count();
  streaming.PublishAsync.AckHandler = NatsPublisher::onAcknowledged;
  streaming.PublishAsync.AckHandlerClosure = &publisher_;
  status = natsConnection_JetStream(context.out(), connection.get(), &streaming);
  if (status != NATS_OK) return describe(status);
  StreamProvision provision = provideStream(context.get(), options_);
  if (provision.failure.empty()) publisher_.attach(context.get(), provision.duplicates);
  return std::move(provision.failure);
}

void NatsLink::connect() {
  {
    const MutexLock lock(mutex_);
    if (closeBy_) return;
    state_ = State::kConnecting;
  }
  NatsConnection connection;
  JetStreamContext context;
  // Connect without the lock, because this can take seconds and callers must be able to queue
  // messages.
  const std::string failure = open(connection, context);
  if (!failure.empty()) {
    if (connection) natsConnection_Close(connection.get());
    return failAttempt(failure);
  }
  natsConnection* const opened = connection.get();
  {
    const MutexLock lock(mutex_);
    // Callbacks for this connection have been ignored until now, because connection_ was not set to
    // it. Ask the library whether the connection was closed in that time.
    endAttempt(natsConnection_IsClosed(opened) ? State::kLost : State::kAway);
    connection_ = std::move(connection);
    context_ = std::move(context);
    lastFailure_.clear();
    attemptPause_ = kAttemptPause;
    isAttemptWanted_ = false;
  }
  kLog.notice("connected to NATS");
  // Call onAvailable() here, because the library calls it only after a reconnection, not after the
  // first connection.
  onAvailable(opened);
}

// Ends a failed attempt. Waiting callers fail with it, and so do queued messages if they cannot be
// kept: their error would only come later.
void NatsLink::failAttempt(const std::string& failure) {
  publisher_.failQueued("no server");
  std::optional<std::uint64_t> worthALine;
  std::string next = "when a session needs a server";
  {
    const MutexLock lock(mutex_);
    const Time now = std::chrono::steady_clock::now();
    endAttempt(State::kIdle);
    lastFailure_ = failure;
    lastAttempt_ = now;
    nextAttempt_ = now + attemptPause_;
    isAttemptWanted_ = false;
    if (publisher_.hasUnsent()) {
      next = "in " + std::to_string(attemptPause_.count()) + " s; messages wait in the store";
      attemptPause_ = std::min(2 * attemptPause_, kLongestPause);
    }
    worthALine = attemptLog_.note(1, now);
  }
  if (worthALine) kLog.error("cannot connect to a NATS server: ", failure, "; trying again ", next);
  answerWaiters();
}

// Ends an attempt. After it, the thread does nothing that takes longer than kConnectionEndTime, and
// close() can wait for it that long.
void NatsLink::endAttempt(State state) {
  state_ = state;
  if (closeBy_) leaveBy_ = *closeBy_ + kConnectionEndTime;
}

// Lets the library's threads return from our callbacks. If the library ended while a callback still
// runs, the message that the callback was about to free would leak.
void NatsLink::drain() {
  natsConnection* const connection = connection_.get();
  {
    const MutexLock lock(mutex_);
    if (connection == nullptr || state_ != State::kConnected) return;
  }
  if (natsConnection_Status(connection) != NATS_CONN_STATUS_CONNECTED) return;
  if (natsConnection_DrainTimeout(connection, kDrainTime.count()) != NATS_OK) return;
  const Time end = std::chrono::steady_clock::now() + 2 * kDrainTime;
  const MutexLock lock(mutex_);
  while (state_ != State::kLost && std::chrono::steady_clock::now() < end)
    changed_.waitUntil(mutex_, end);
}

void NatsLink::dropConnection() {
  NatsConnection connection;
  JetStreamContext context;
  bool isEnding = false;
  {
    const MutexLock lock(mutex_);
    connection = std::move(connection_);
    context = std::move(context_);
    state_ = State::kIdle;
    maxPayload_ = 0;
    servers_ = Array();
    isEnding = closeBy_.has_value();
    publisher_.setOnline(false);
  }
  // Detach the publisher before closing the connection, because closing can hang until a server
  // answers.
  publisher_.detach();
  if (isEnding) publisher_.abandonAll();
  if (connection) natsConnection_Close(connection.get());
  context.reset();
  connection.reset();
}

void NatsLink::onAvailable(natsConnection* connection) {
  const Array servers = serversOf(connection);
  const std::int64_t maxPayload = natsConnection_GetMaxPayload(connection);
  const bool isConnected = natsConnection_Status(connection) == NATS_CONN_STATUS_CONNECTED;
  const MutexLock lock(mutex_);
  // The library calls back on its own threads, and may do so late. The connection may have been
  // replaced or closed since.
  if (connection != connection_.get() || !isConnected || state_ == State::kLost) return;
  state_ = State::kConnected;
  servers_ = servers;
  maxPayload_ = static_cast<std::size_t>(std::max<std::int64_t>(maxPayload, 0));
  publisher_.setOnline(true);
  changed_.notifyAll();
}

void NatsLink::onAway(natsConnection* connection) {
  {
    const MutexLock lock(mutex_);
    if (connection != connection_.get()) return;
    if (state_ == State::kConnected) state_ = State::kAway;
    // Hold messages now, before the library reconnects. A message that is published after the
    // reconnection would otherwise overtake the messages that were sent but not acknowledged.
    publisher_.holdAfterLoss();
    publisher_.setOnline(false);
    changed_.notifyAll();
  }
  kLog.notice("lost the connection to NATS; reconnecting; messages wait");
}

void NatsLink::onClosed(natsConnection* connection) {
  const MutexLock lock(mutex_);
  if (connection != connection_.get()) return;
  state_ = State::kLost;
  publisher_.setOnline(false);
  changed_.notifyAll();
}

}  // namespace halvox::platform::linux_
