#include <algorithm>
#include <span>
#include <utility>

#include "platform/linux/link/nats/NatsLink.h"
#include "platform/linux/link/nats/NatsLog.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog(natsLogCategory, "NatsLink");

// One server that accepts and says nothing may take so much of an attempt, all of them together
// kServersTime, so that the attempt ends before those who wait for it have given up.
constexpr std::chrono::milliseconds kServerTime{2000};
constexpr std::chrono::milliseconds kServersTime{6000};
constexpr std::chrono::milliseconds kRequestTime{750};  // up to two for the stream
constexpr std::chrono::milliseconds kWriteTime{2000};
constexpr std::chrono::milliseconds kReconnectPause{250};
constexpr std::chrono::milliseconds kReconnectJitter{250};
constexpr std::chrono::milliseconds kPingPause{20'000};
constexpr int kLostPings = 2;
constexpr int kForEver = -1;

// What the stream keeps when this service makes it. Whoever wants other limits makes it first.
constexpr std::int64_t kStreamBytes = std::int64_t{4} << 30;
constexpr std::chrono::nanoseconds kStreamAge = std::chrono::hours(24 * 30);
// For so long the stream knows its messages again; whatever is published again is so within half of
// it.
constexpr std::chrono::nanoseconds kDuplicatesTime = std::chrono::minutes(2);
static_assert(kDuplicatesTime >= 2 * NatsLink::kAckTime);

// The library shall keep nothing while the servers are away, see NatsLink. It does so with 0,
// unlike what it says of itself; with 1 byte it keeps a whole message.
constexpr int kReconnectBufferBytes = 0;
constexpr std::chrono::milliseconds kDrainTime{1000};

std::string describe(natsStatus status) {
  natsStatus last = NATS_OK;
  const char* const detail = nats_GetLastError(&last);
  std::string text = natsStatus_GetText(status);
  if (last == status && detail != nullptr && *detail != '\0' && text != detail) {
    text += std::string(" (") + detail + ")";
  }
  return text;
}

Array serversOf(natsConnection* connection) {
  char** urls = nullptr;
  int count = 0;
  if (natsConnection_GetServers(connection, &urls, &count) != NATS_OK) return {};
  std::vector<Value> values;
  for (char* const url : std::span(urls, static_cast<std::size_t>(count))) {
    values.emplace_back(std::string_view(url));
    std::free(url);
  }
  std::free(static_cast<void*>(urls));
  return Array(std::span<const Value>(values));
}

}  // namespace

natsStatus NatsLink::secure(natsOptions* options) {
  if (!options_.credentials.empty()) {
    const natsStatus status =
        natsOptions_SetUserCredentialsFromFiles(options, options_.credentials.c_str(), nullptr);
    if (status != NATS_OK) return status;
  }
  if (!options_.tls) return NATS_OK;
  const Configuration::Link::Tls& tls = *options_.tls;
  natsStatus status = natsOptions_SetSecure(options, true);
  if (status == NATS_OK && !tls.ca.empty()) {
    status = natsOptions_LoadCATrustedCertificates(options, tls.ca.c_str());
  }
  if (status == NATS_OK && !tls.certificate.empty()) {
    status = natsOptions_LoadCertificatesChain(options, tls.certificate.c_str(), tls.key.c_str());
  }
  if (status == NATS_OK && !tls.verify) {
    status = natsOptions_SkipServerVerification(options, true);
  }
  return status;
}

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
  // Errors without a message of ours to blame are told by what becomes of the messages.
  const auto ignore = [](natsConnection*, natsSubscription*, natsStatus, void*) {};
  for (const natsStatus status :
       {natsOptions_SetServers(options, urls.data(), static_cast<int>(urls.size())),
        natsOptions_SetName(options, "halvox-reportingd"),
        natsOptions_SetTimeout(options, std::max<std::int64_t>(timeout, 100)),
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
  return secure(options);
}

std::string NatsLink::provideStream(jsCtx* context) {
  JetStreamInfo info;
  jsErrCode code{};
  natsStatus status =
      js_GetStreamInfo(info.out(), context, options_.stream.c_str(), nullptr, &code);
  ackTime_ = kAckTime;
  if (status == NATS_OK) {  // as it is, whatever it was made for
    const std::chrono::nanoseconds duplicates(info.get()->Config->Duplicates);
    ackTime_ = std::min<std::chrono::nanoseconds>(kAckTime, duplicates / 2);
    return {};
  }
  if (status != NATS_NOT_FOUND && code != JSStreamNotFoundErr) {
    return "stream " + options_.stream + ": " + describe(status);
  }
  const std::string subjects = options_.subject + ".>";
  const char* subject = subjects.c_str();
  jsStreamConfig stream;
  jsStreamConfig_Init(&stream);
  stream.Name = options_.stream.c_str();
  stream.Subjects = &subject;
  stream.SubjectsLen = 1;
  stream.Storage = js_FileStorage;
  stream.MaxBytes = kStreamBytes;
  stream.MaxAge = kStreamAge.count();
  stream.Replicas = static_cast<std::int64_t>(options_.replicas);
  stream.Duplicates = kDuplicatesTime.count();
  status = js_AddStream(info.out(), context, &stream, nullptr, &code);
  if (status == NATS_OK) kLog.notice("made the stream ", options_.stream);
  // Another service may have made it in the meantime.
  if (status == NATS_OK || code == JSStreamNameExistErr) return {};
  return "stream " + options_.stream + " cannot be made: " + describe(status);
}

// Nobody takes messages while the stream has no leader, but neither when there is none any more: it
// was deleted, or its server lost its files.
void NatsLink::provideStreamAgain() {
  const Time now = std::chrono::steady_clock::now();
  {
    const MutexLock lock(mutex_);
    if (!isStreamInDoubt_ || now < nextStreamCheck_) return;
    isStreamInDoubt_ = false;
  }
  const std::string failure = provideStream(context_.get());
  nextStreamCheck_ = std::chrono::steady_clock::now() + kStreamCheckPause;
  if (failure.empty()) return;
  std::optional<std::uint64_t> worthALine;
  {
    const MutexLock lock(mutex_);
    worthALine = attemptLog_.note(1, now);
  }
  if (worthALine) kLog.error("no server of the link takes messages: ", failure);
}

// Why it failed; empty on success.
std::string NatsLink::open(NatsConnection& connection, JetStreamContext& context) {
  NatsOptionsHandle options;
  natsStatus status = natsOptions_Create(options.out());
  if (status == NATS_OK) status = configure(options.get());
  if (status == NATS_OK) status = natsConnection_Connect(connection.out(), options.get());
  if (status != NATS_OK) return describe(status);
  jsOptions streaming;
  jsOptions_Init(&streaming);
  streaming.Wait = kRequestTime.count();
  streaming.PublishAsync.AckHandler = onAcknowledged;
  streaming.PublishAsync.AckHandlerClosure = this;
  status = natsConnection_JetStream(context.out(), connection.get(), &streaming);
  if (status != NATS_OK) return describe(status);
  return provideStream(context.get());
}

void NatsLink::connect() {
  {
    const MutexLock lock(mutex_);
    if (closeBy_) return;
    isConnecting_ = true;
  }
  NatsConnection connection;
  JetStreamContext context;
  std::string failure = open(connection, context);
  if (failure.empty()) {
    natsConnection* const opened = connection.get();
    {
      const MutexLock lock(mutex_);
      endAttempt();
      connection_ = std::move(connection);
      context_ = std::move(context);
      lastFailure_.clear();
      isLost_ = natsConnection_IsClosed(opened);
    }
    kLog.notice("the link is connected");
    return onAvailable(opened);
  }
  if (connection) natsConnection_Close(connection.get());
  std::deque<OutgoingMessage> unsent;
  std::optional<std::uint64_t> worthALine;
  {
    const MutexLock lock(mutex_);
    endAttempt();
    lastFailure_ = failure;
    nextAttempt_ = std::chrono::steady_clock::now() + kAttemptPause;
    unsent.swap(queue_);
    queuedBytes_ = 0;
    worthALine = attemptLog_.note(1, std::chrono::steady_clock::now());
  }
  if (worthALine) kLog.error("no server of the link was reached: ", failure);
  fail(unsent, "no server");
  answerWaiters();
}

// From here on the thread does nothing that takes longer than close() has time for.
void NatsLink::endAttempt() {
  isConnecting_ = false;
  if (closeBy_) leaveBy_ = *closeBy_ + kConnectionEndTime;
}

// Lets the library's threads return from all calls of ours. Ended before that, it leaves a message
// behind which one of them was about to free.
void NatsLink::drain() {
  natsConnection* const connection = connection_.get();
  {
    const MutexLock lock(mutex_);
    if (connection == nullptr || !isConnected_) return;
  }
  if (natsConnection_Status(connection) != NATS_CONN_STATUS_CONNECTED) return;
  if (natsConnection_DrainTimeout(connection, kDrainTime.count()) != NATS_OK) return;
  const Time end = std::chrono::steady_clock::now() + 2 * kDrainTime;
  const MutexLock lock(mutex_);
  while (!isLost_ && std::chrono::steady_clock::now() < end) changed_.waitUntil(mutex_, end);
}

void NatsLink::dropConnection() {
  NatsConnection connection;
  JetStreamContext context;
  std::vector<PendingAcks::Entry> lost;
  std::deque<OutgoingMessage> unsent;
  {
    const MutexLock lock(mutex_);
    connection = std::move(connection_);
    context = std::move(context_);
    isConnected_ = false;
    isLost_ = false;
    isWindowFull_ = false;
    flow_ = Flow::kFlowing;
    isStreamInDoubt_ = false;
    maxPayload_ = 0;
    servers_ = Array();
    lost = pending_.takeAll();
    if (closeBy_) unsent.swap(queue_);
  }
  // First, because the library may keep the thread until a server speaks.
  abandon(lost, "the connection ended");
  fail(unsent, "the service ended");
  if (connection) natsConnection_Close(connection.get());
  context.reset();
  connection.reset();
}

void NatsLink::onAvailable(natsConnection* connection) {
  const Array servers = serversOf(connection);
  const std::int64_t maxPayload = natsConnection_GetMaxPayload(connection);
  const bool isConnected = natsConnection_Status(connection) == NATS_CONN_STATUS_CONNECTED;
  const MutexLock lock(mutex_);
  if (connection != connection_.get() || !isConnected) return;
  isConnected_ = true;
  servers_ = servers;
  maxPayload_ = static_cast<std::size_t>(std::max<std::int64_t>(maxPayload, 0));
  changed_.notifyAll();
}

void NatsLink::onAway(natsConnection* connection) {
  {
    const MutexLock lock(mutex_);
    if (connection != connection_.get()) return;
    isConnected_ = false;
    beginHolding(std::chrono::steady_clock::now());
    changed_.notifyAll();
  }
  kLog.notice("the link lost its server and looks for it");
}

void NatsLink::onClosed(natsConnection* connection) {
  const MutexLock lock(mutex_);
  if (connection != connection_.get()) return;
  isConnected_ = false;
  isLost_ = true;
  changed_.notifyAll();
}

}  // namespace halvox::platform::linux_
