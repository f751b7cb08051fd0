#include "platform/linux/connection/ConnectionHost.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <utility>
#include <variant>

#include <sys/resource.h>
#include <systemd/sd-daemon.h>
#include <systemd/sd-id128.h>

#include "platform/linux/base/ErrnoText.h"
#include "platform/linux/connection/BusConnection.h"
#include "platform/linux/connection/BusConnector.h"
#include "platform/linux/connection/ConnectionLog.h"
#include "platform/linux/connection/ListeningSocket.h"
#include "platform/linux/connection/PeerConnection.h"
#include "platform/linux/connection/SignalWatch.h"
#include "platform/services.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog{connectionCategory, "ConnectionHost"};

std::string hexOf(const sd_id128_t& id) {
  std::array<char, SD_ID128_STRING_MAX> text;
  return sd_id128_to_string(id, text.data());
}

ServiceIdentity makeIdentity(const std::string& busName) {
  ServiceIdentity identity{.guidHex = {}, .busName = busName, .machineHex = {}};
  sd_id128_t id;
  // Clients use the GUID to recognise a server that they already know. If the system provides no
  // random number, use zeros, because the handshake needs 32 digits of any value.
  identity.guidHex = sd_id128_randomize(&id) >= 0 ? hexOf(id) : std::string(32, '0');
  if (sd_id128_get_machine(&id) >= 0) identity.machineHex = hexOf(id);
  return identity;
}

// Raises the soft limit of descriptors to the hard limit. Every client takes a descriptor, and the
// soft limit is usually only 1,024.
void allowMoreDescriptors() {
  rlimit limit{};
  if (getrlimit(RLIMIT_NOFILE, &limit) != 0) return;
  limit.rlim_cur = limit.rlim_max;
  static_cast<void>(setrlimit(RLIMIT_NOFILE, &limit));
}

Failure<ConnectionOpenError> systemFailure(const std::string& what) {
  return {.code = ConnectionOpenError::kSystem, .message = what + ": " + errnoText(errno)};
}

}  // namespace

ConnectionHost::ConnectionHost(ConnectionOptions options, Backpressure& backpressure)
    : options_(std::move(options)),
      backpressure_(backpressure),
      identity_(makeIdentity(options_.busName)),
      inbox_(std::make_shared<Inbox>()),
      handshakes_(options_.handshakeTimeout),
      messages_(options_.messageTimeout),
      acceptRetries_(kAcceptRetryDelay),
      watchdog_(options_.hasProgressed),
      turn_(options_.beginBatch, options_.endBatch, options_.afterReplies) {
  // Block the signals here and not in open(): only threads that are started later inherit the mask.
  // A thread without the mask would receive the signal instead of the loop, and the signal would
  // kill the process.
  if (options_.signals == EndSignals::kHandle) SignalWatch::block();
  backpressure_.setReliefHandler([inbox = inbox_] { inbox->postRelief(); });
}

ConnectionHost::~ConnectionHost() { shutDown(); }

Result<void, ConnectionOpenError> ConnectionHost::open() {
  statistics_ = std::make_shared<ConnectionStatistics>(platform::statistics());
  dispatcher_ = std::make_unique<RequestDispatcher>(options_, *statistics_, identity_);
  allowMoreDescriptors();
  if (auto opened = openLoop(); !opened) return opened;
  if (auto opened = openSockets(); !opened) return opened;
  return openBuses();
}

Result<void, ConnectionOpenError> ConnectionHost::openLoop() {
  if (!loop_.isOpen() || !inbox_->watchWith(loop_) || !timer_.open(loop_)) {
    return systemFailure("cannot create the event loop");
  }
  if (options_.signals == EndSignals::kLeaveAlone) return {};
  signals_ = std::make_unique<SignalWatch>([this] { stopping_ = true; }, options_.onReportSignal);
  if (!signals_->start(loop_)) return systemFailure("cannot watch the signals");
  return {};
}

Result<void, ConnectionOpenError> ConnectionHost::openSockets() {
  // A passed socket and its file belong to systemd. If there is one, the service makes no socket of
  // its own and removes no file at the end.
  auto sockets = passedSockets();
  if (!sockets) return std::move(sockets).error();
  if (sockets->empty()) {
    if (options_.makeSocketDirectory) makeDirectoryOf(options_.socket, options_.socketAccess);
    auto bound = listenOn(options_.socket, options_.socketAccess);
    if (!bound) return std::move(bound).error();
    socketFile_ = std::move(bound->file);
    sockets->push_back(std::move(bound->fd));
  }
  for (UniqueFd& fd : *sockets) {
    listeners_.push_back(std::make_unique<ListeningSocket>(std::move(fd), *this));
    if (!listeners_.back()->start()) return systemFailure("cannot watch the listening socket");
  }
  return {};
}

Result<void, ConnectionOpenError> ConnectionHost::openBuses() {
  const std::optional<StarterBus>& starter = options_.starter;
  const bool wantsBus = options_.bus != BusKind::kNone;
  // Join each bus only once, because a bus gives a name to only one connection.
  const bool isStartersBus = wantsBus && starter.has_value() && starter->kind == options_.bus;
  if (wantsBus) {
    auto joined = joinBus(isStartersBus ? starter->address : busAddressOf(options_.bus));
    if (!joined) return joined;
  }
  if (!starter.has_value() || isStartersBus) return {};
  // Start even if this bus cannot be joined. Its address comes from environment variables that
  // child processes inherit. If a bus has started a terminal, every program in that terminal has
  // these variables, although the bus did not start those programs.
  if (const auto joined = joinBus(starter->address); !joined) {
    kLog.error("cannot join the bus that started the service: ", joined.error().message,
               "; clients reach the service through its socket",
               wantsBus ? " and listener.bus" : "");
  } else {
    kLog.notice("serving the bus that started the service, ", starter->address);
  }
  return {};
}

Result<void, ConnectionOpenError> ConnectionHost::joinBus(const std::string& address) {
  auto connected = BusConnector(options_.busName).connect(address);
  if (!connected) return std::move(connected).error();
  buses_.push_back(std::make_unique<BusConnection>(*this, *std::move(connected)));
  return {};
}

void ConnectionHost::resume() {
  if (delegate_ == nullptr || listeners_.empty()) {
    kLog.error(
        "resume() was called before open() succeeded or without a delegate; serving nothing");
    return;
  }
  // Do this before the first turn: a reply that is given on this thread must not go through the
  // inbox.
  inbox_->attachToThisThread();
  for (const auto& bus : buses_) bus->start();
  kLog.info("serving ", listeners_.size(), " sockets and ", buses_.size(), " buses");
  static_cast<void>(sd_notifyf(0, "READY=1\nSTATUS=Serving %zu sockets and %zu buses",
                               listeners_.size(), buses_.size()));
  watchdog_.start();
  while (!stopping_) takeTurn();
  static_cast<void>(sd_notify(0, "STOPPING=1\nSTATUS=Completing the requests that were read"));
  for (const auto& [key, peer] : peers_) peer->sayGoodbye();
  shutDown();
}

void ConnectionHost::takeTurn() {
  const bool sleeps = maySleep();
  timer_.arrange(firstDeadline(),
                 sleeps ? LoopTimer::Before::kSleep : LoopTimer::Before::kNextTurn);
  turn_.begin();
  const std::size_t ready =
      loop_.runOnce(sleeps ? EventLoop::Wait::kBlock : EventLoop::Wait::kPoll);
  // Call awake() first. Other threads then post to the inbox without a system call during this
  // turn.
  if (sleeps) inbox_->awake();
  // Check the deadlines after the events. A message whose last bytes have just arrived is then in
  // time.
  expireDeadlines();
  turn_.deliver(ready);
  turn_.finishEnded();
  turn_.endDeliveries();
  // Read the inbox after the batch and before the writes. The replies of other threads then leave
  // together with the replies of this thread.
  readMail();
  turn_.flush();
  turn_.reap();
}

bool ConnectionHost::maySleep() { return !turn_.hasWork() && inbox_->trySleep(); }

std::optional<DeadlineQueue::Clock::time_point> ConnectionHost::firstDeadline() const {
  std::optional<DeadlineQueue::Clock::time_point> first;
  for (const DeadlineQueue* queue :
       {&handshakes_, &messages_, &acceptRetries_, &watchdog_.looks()}) {
    const auto due = queue->first();
    if (due.has_value() && (!first.has_value() || *due < *first)) first = due;
  }
  return first;
}

void ConnectionHost::expireDeadlines() {
  // Most turns have no deadline, and this saves them reading the clock.
  if (!firstDeadline().has_value()) return;
  const auto now = DeadlineQueue::Clock::now();
  for (DeadlineQueue* queue : {&handshakes_, &messages_, &acceptRetries_, &watchdog_.looks()}) {
    queue->expire(now);
  }
}

void ConnectionHost::readMail() {
  inbox_->take(mail_);
  for (const PostedReply& reply : mail_.replies) {
    reply.ticket->deliver(reply.error.get(), reply.value);
  }
  for (const std::shared_ptr<ClientLink>& client : mail_.clientsWithRoom) {
    // The client may have disconnected since the post, because a request can outlive its
    // connection.
    if (client->connection() != nullptr) client->connection()->onRoom();
  }
  if (mail_.relieved) turn_.relieve();
  if (mail_.stopAsked) stopping_ = true;
  mail_.clear();
}

void ConnectionHost::acceptPeer(UniqueFd fd, const PeerCredentials& credentials) {
  auto peer =
      std::make_shared<PeerConnection>(*this, nextClientNumber(), std::move(fd), credentials);
  // Add the peer before asking the delegate, because a peer that the delegate refuses removes
  // itself from the map.
  peers_.emplace(peer.get(), peer);
  peer->start();
  static_cast<void>(admit(peer));
}

bool ConnectionHost::admit(const std::shared_ptr<ClientConnection>& client) {
  turn_.beforeDelivery();
  if (delegate_->listenerShouldAcceptNewConnection(client)) {
    statistics_->connectionsAccepted.add();
    return true;
  }
  statistics_->connectionsRefused.add();
  client->abandon();
  return false;
}

void ConnectionHost::peerClosed(PeerConnection& peer) {
  peers_.erase(&peer);
  // A listener may have paused for lack of descriptors, and a descriptor is free now.
  for (const auto& listener : listeners_) listener->tryAgain();
}

// May be called more than once, and after an open() that failed half-way.
void ConnectionHost::shutDown() {
  // Close the inbox first. The objects that are released below post replies and other notices,
  // which the closed inbox drops.
  inbox_->close();
  turn_.clear();
  // Empty the map first, because an abandoned peer removes itself from it.
  const auto peers = std::exchange(peers_, {});
  for (const auto& [key, peer] : peers) peer->abandon();
  for (const auto& bus : buses_) bus->abandon();
  listeners_.clear();
  socketFile_.remove();
}

}  // namespace halvox::platform::linux_
