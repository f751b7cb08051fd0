#include "platform/linux/connection/PeerConnection.h"

#include <span>
#include <utility>

#include "platform/linux/connection/ConnectionHost.h"
#include "platform/linux/connection/ConnectionLog.h"
#include "platform/linux/connection/wire/EndedSignal.h"
#include "platform/linux/connection/wire/FrameWriter.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog{connectionCategory, "PeerConnection"};

}  // namespace

PeerConnection::PeerConnection(ConnectionHost& host, std::uint64_t number, UniqueFd fd,
                               const PeerCredentials& credentials)
    : ClientConnection(host, number, credentials),
      stream_(std::move(fd), host, *this),
      handshake_(std::make_unique<dbus::ServerHandshake>(host.identity().guidHex, credentials.uid)),
      deadline_(*this) {}

void PeerConnection::start() {
  stream_.setReading(true);
  host().handshakes().start(deadline_);
}

std::string PeerConnection::description() const {
  return "client " + std::to_string(number()) + " (pid " + std::to_string(processIdentifier()) +
         ", uid " + std::to_string(credentials().uid) + ")";
}

void PeerConnection::setReading(bool reading) {
  // Stop the deadline of a message: while the service does not read from the client, the client
  // cannot complete the message.
  if (!reading) deadline_.stop();
  // The handshake continues even while the delegate has not accepted the client yet.
  stream_.setReading(reading || handshake_ != nullptr);
}

void PeerConnection::onReadable() {
  // Do not read more while received messages still wait to be delivered.
  if (handshake_ == nullptr && !wantsInput()) return;
  if (stream_.read() == SocketStream::Read::kEnded) {
    // A client may send its last requests and close the socket at once. Deliver these requests
    // before the connection ends.
    peerClosed_ = true;
    stream_.setReading(false);
  }
  if (handshake_ != nullptr && !continueHandshake()) {
    stream_.input().settle();
    if (peerClosed_) end(Why::kPeerVanished);
    return;
  }
  deliver();
}

bool PeerConnection::continueHandshake() {
  const dbus::HandshakeProgress progress =
      handshake_->feed(stream_.input().unused(), stream_.output().bytes());
  stream_.outputAdded();
  stream_.input().consume(progress.consumedBytes);
  switch (progress.state) {
    case dbus::HandshakeState::kContinue:
      return false;
    case dbus::HandshakeState::kDone:
      handshake_.reset();
      deadline_.stop();
      return true;
    case dbus::HandshakeState::kFailed:
      kLog.notice("disconnecting ", description(), ": the handshake failed: ", progress.error);
      end(Why::kClosedHere);
      return false;
  }
  return false;
}

void PeerConnection::onDelivered(bool begun, bool progress) {
  if (peerClosed_) {
    if (begun) {
      kLog.info("", description(), " disconnected in the middle of a message; discarding ",
                stream_.input().unused().size(), " bytes");
    }
    return end(Why::kPeerVanished);
  }
  stream_.setReading(true);
  if (handshake_ != nullptr) return;
  // Only a whole message restarts the deadline. A client that sends single bytes gains no time.
  if (progress || !begun) deadline_.stop();
  if (begun) host().messages().start(deadline_);
}

void PeerConnection::onDeadline() {
  const bool inHandshake = handshake_ != nullptr;
  const auto waited = inHandshake ? host().handshakes().delay() : host().messages().delay();
  kLog.notice("closing ", description(), ": waited ", waited.count(), " ms for the end of ",
              inHandshake ? "its handshake" : "a message that it has begun");
  host().statistics().connectionsTimedOut.add();
  end(Why::kClosedHere);
}

void PeerConnection::sayGoodbye() {
  const NSXPCInterface* exported = exportedInterface();
  if (handshake_ != nullptr || hasEnded() || exported == nullptr) return;
  const Value last(std::uint64_t{lastRequest()});
  const dbus::CallTarget sender{.destination = {},
                                .path = exported->objectPath,
                                .interface = dbus::kConnectionInterface,
                                .member = dbus::kEndedSignal};
  if (!dbus::appendSignal(stream_.output().bytes(), stream_.nextSerial(), sender,
                          dbus::kEndedSignature, std::span(&last, 1))) {
    return;
  }
  // Do not call frameAppended(), because this is no reply.
  stream_.flush();
}

void PeerConnection::onEnded() {
  deadline_.stop();
  stream_.setReading(false);
}

void PeerConnection::onFinished() {
  if (stream_.close()) host().peerClosed(*this);
}

}  // namespace halvox::platform::linux_
