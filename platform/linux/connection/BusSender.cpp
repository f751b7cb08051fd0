#include "platform/linux/connection/BusSender.h"

#include <utility>

#include "platform/linux/connection/BusConnection.h"
#include "platform/linux/connection/ConnectionHost.h"
#include "platform/linux/connection/ConnectionLog.h"
#include "platform/linux/connection/ErrorNames.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog{connectionCategory, "BusSender"};

}  // namespace

BusSender::BusSender(ConnectionHost& host, BusConnection& bus, std::string name)
    : ClientConnection(host, host.nextClientNumber(), {}),
      bus_(bus),
      name_(std::move(name)),
      input_(host.options().maxFrameBytes),
      identity_(*this) {
  host.handshakes().start(identity_);
}

std::string BusSender::description() const {
  return "client " + std::to_string(number()) + " (pid " + std::to_string(processIdentifier()) +
         ", " + name_ + " on the bus)";
}

void BusSender::receive(const dbus::MessageHeader& header, std::span<const std::byte> frame) {
  const std::size_t waiting = input_.unused().size();
  // If no other request waits, accept a request of any size up to the limit of frames. The bound is
  // only for requests that pile up.
  if (waiting == 0 || waiting + frame.size() <= kMaxWaitingBytesOfSender) {
    input_.append(frame);
    return;
  }
  host().statistics().requestsReceived.add();
  refuse(header, Refusal::kTooManyWaiting, error_names::kLimitsExceeded,
         std::to_string(waiting) + " bytes of earlier requests are waiting; the limit is " +
             std::to_string(kMaxWaitingBytesOfSender) + "; wait for replies before sending more");
}

void BusSender::receiveOversized(const FrameBuffer::Next& next) { refuseOversized(next); }

void BusSender::deliverReceived() {
  // Skip a sender that flow control holds back. The sender continues when enough of its requests
  // have been carried out.
  if (wantsInput()) deliver();
}

void BusSender::onCredentials(const PeerCredentials& credentials) {
  if (isKnown_ || hasEnded()) return;
  isKnown_ = true;
  identity_.stop();
  setCredentials(credentials);
  if (!host().admit(shared_from_this())) return;
  deliverReceived();
}

void BusSender::onVanished() {
  // Deliver the remaining requests, because the sender may have left on purpose after its last
  // message.
  vanished_ = true;
  deliverReceived();
}

void BusSender::onBusLost() {
  // The delegate sets the handlers, and it has not been asked about a sender that is still unknown.
  // Such a sender has no handlers to call.
  isKnown_ ? end(Why::kPeerVanished) : abandon();
}

SocketStream& BusSender::stream() { return bus_.stream(); }

void BusSender::setReading(bool reading) {
  if (!reading) bus_.noteWaitingSender();
}

void BusSender::onDelivered(bool /*begun*/, bool /*progress*/) {
  if (vanished_) end(Why::kPeerVanished);
}

void BusSender::onFinished() { bus_.forget(*this); }

// Does not close the connection, because all senders share it. The stream is still intact, because
// the bus forwards only valid frames.
void BusSender::onMalformed(const std::string& what) {
  kLog.error("dropped a message of ", description(), ": not a valid D-Bus message: ", what);
  host().statistics().connectionsMalformed.add();
}

}  // namespace halvox::platform::linux_
