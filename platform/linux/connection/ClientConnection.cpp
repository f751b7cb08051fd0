#include "platform/linux/connection/ClientConnection.h"

#include <utility>
#include <variant>
#include <vector>

#include "platform/linux/connection/ConnectionHost.h"
#include "platform/linux/connection/ConnectionLog.h"
#include "platform/linux/connection/ErrorNames.h"
#include "platform/linux/connection/wire/FrameWriter.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog{connectionCategory, "ClientConnection"};

}  // namespace

ClientConnection::ClientConnection(ConnectionHost& host, std::uint64_t number,
                                   const PeerCredentials& credentials)
    : host_(host),
      number_(number),
      credentials_(credentials),
      link_(std::make_shared<ClientLink>(host.inbox(), host.sharedStatistics())) {
  link_->attach(*this);
}

void ClientConnection::setExportedInterface(const NSXPCInterface& interface) {
  interface_ = &interface;
}

void ClientConnection::setExportedObject(std::shared_ptr<ExportedObject> object) {
  object_ = std::move(object);
}

void ClientConnection::setInterruptionHandler(std::function<void()> handler) {
  interruptionHandler_ = std::move(handler);
}

void ClientConnection::setInvalidationHandler(std::function<void()> handler) {
  invalidationHandler_ = std::move(handler);
}

void ClientConnection::resume() {
  if (state_ != State::kNotResumed) return;
  state_ = State::kReading;
  setReading(true);
  // Requests that came together with the end of the handshake have been read already. The socket
  // does not become readable because of them, and nothing else would start their delivery.
  if (!input().unused().empty()) becomeDue();
}

void ClientConnection::deliver() {
  // Before resume(), the delegate has not yet accepted this client.
  if (state_ == State::kNotResumed) setReading(false);
  if (state_ == State::kNotResumed || state_ == State::kEnded) return input().settle();
  state_ = State::kReading;
  // While too many messages wait for the store, a client that sends more than a short share waits
  // until the store has caught up. A client that sends less is not slowed down.
  const bool pressed = host_.backpressure().isHigh();
  std::size_t requestsLeft = pressed ? kShortTurnRequests : host_.turn().requestsPerClient();
  std::size_t bytes = 0;
  while (true) {
    const FrameBuffer::Next next = input().next();
    if (next.state == FrameBuffer::State::kEmpty || next.state == FrameBuffer::State::kPartial) {
      onDelivered(next.state == FrameBuffer::State::kPartial, bytes > 0);
      break;
    }
    // Call mustWait() only if there is a whole frame, because a client without a request need not
    // wait. Call it before testing the share: the next turn would visit a client whose share is
    // used up, in vain if the client must wait.
    if (mustWait()) break;
    // `bytes` does not include this frame. A frame that is larger than a whole share is therefore
    // delivered, too.
    if (requestsLeft == 0 || bytes >= kTurnBytes) {
      pressed ? waitInState(State::kWaitingForRelief) : becomeDue();
      break;
    }
    if (deliverFrame(next) == Step::kStop) break;
    input().consume(next.totalBytes);
    bytes += next.totalBytes;
    --requestsLeft;
  }
  if (object_ != nullptr) object_->endOfRequests();
  // Do this after every delivery, because the next client reads into the same scratch.
  input().settle();
}

ClientConnection::Step ClientConnection::deliverFrame(const FrameBuffer::Next& next) {
  if (next.state == FrameBuffer::State::kBroken) {
    onMalformed(next.error.message);
    return Step::kStop;
  }
  if (next.state == FrameBuffer::State::kOversized) {
    refuseOversized(next);
    return hasEnded() ? Step::kStop : Step::kGoOn;
  }
  const std::variant<dbus::Frame, dbus::WireError> read =
      dbus::readFrame(next.bytes, host_.headers());
  if (const auto* error = std::get_if<dbus::WireError>(&read); error != nullptr) {
    onMalformed(error->message + " at byte " + std::to_string(error->offset));
    return Step::kStop;
  }
  // A delivery adds jobs to queues. Only inside a batch can this thread run these jobs itself, and
  // wake the pool once for all of them.
  host_.turn().beforeDelivery();
  host_.dispatcher().dispatch(*this, std::get<dbus::Frame>(read), next.totalBytes);
  return hasEnded() ? Step::kStop : Step::kGoOn;
}

// To learn what to answer, reads the header as if the message had no body. The bytes of the body
// are dropped as they arrive and are never kept in memory.
void ClientConnection::refuseOversized(const FrameBuffer::Next& next) {
  const std::vector<std::byte> header = FrameBuffer::withoutBody(next);
  const std::variant<dbus::Frame, dbus::WireError> read = dbus::readFrame(header);
  if (const auto* error = std::get_if<dbus::WireError>(&read); error != nullptr) {
    return onMalformed(error->message + " at byte " + std::to_string(error->offset));
  }
  const dbus::MessageHeader& request = std::get<dbus::Frame>(read).header;
  // Only method calls are answered.
  if (request.type != dbus::MessageType::kMethodCall) return;
  host_.statistics().requestsReceived.add();
  setLastRequest(request.serial);
  refuse(request, Refusal::kTooLarge, error_names::kLimitsExceeded,
         "the message has " + std::to_string(next.totalBytes) + " bytes; the limit is " +
             std::to_string(host_.options().maxFrameBytes));
}

bool ClientConnection::mustWait() {
  // wait() returns false if another thread has completed enough requests since isFull(). Nothing
  // would then wake this client, and it must continue at once.
  if (link_->flow().isFull() && link_->flow().wait()) {
    waitInState(State::kWaitingForRoom);
    return true;
  }
  const OutputQueue& output = stream().output();
  if (output.unsentFrames() >= kMaxUnreadReplies || output.unsentBytes() >= kMaxUnreadReplyBytes) {
    waitInState(State::kWaitingForReader);
    return true;
  }
  return false;
}

void ClientConnection::waitInState(State state) {
  state_ = state;
  setReading(false);
  if (state == State::kWaitingForRelief) host_.turn().deliverWhenRelieved(shared_from_this());
}

void ClientConnection::becomeDue() {
  state_ = State::kDue;
  host_.turn().deliverNext(shared_from_this());
}

void ClientConnection::onRoom() {
  if (state_ == State::kWaitingForRoom) becomeDue();
}

void ClientConnection::onRelief() {
  if (state_ == State::kWaitingForRelief) becomeDue();
}

void ClientConnection::onOutputRoom() {
  if (state_ != State::kWaitingForReader) return;
  const OutputQueue& output = stream().output();
  // Wait until half of the replies are read. If the client continued just below the bound, a slow
  // reader would stop and start again with every reply.
  if (output.unsentFrames() > kMaxUnreadReplies / 2) return;
  if (output.unsentBytes() > kMaxUnreadReplyBytes / 2) return;
  becomeDue();
}

void ClientConnection::end(Why why) {
  if (state_ == State::kEnded) return;
  state_ = State::kEnded;
  why_ = why;
  // finish() calls the handlers in the next turn, because end() may be called during a delivery
  // whose replies still have to be sent.
  onEnded();
  host_.turn().finishNext(shared_from_this());
}

void ClientConnection::finish() {
  // platform/connection.h promises this order of the handlers, and promises the interruption only
  // if the other side has ended the connection.
  if (why_ == Why::kPeerVanished && interruptionHandler_) interruptionHandler_();
  if (invalidationHandler_) invalidationHandler_();
  if (unloggedRefusals_ > 0) {
    kLog.notice("refused ", unloggedRefusals_, " more requests of ", description(),
                " for the same reasons");
  }
  host_.statistics().connectionsEnded.add();
  letGo();
}

void ClientConnection::abandon() {
  if (state_ != State::kEnded) {
    state_ = State::kEnded;
    onEnded();
  }
  letGo();
}

void ClientConnection::letGo() {
  // Detach first. The objects that are released below can answer requests, and those replies must
  // not reach a connection that has finished.
  link_->detach();
  interruptionHandler_ = nullptr;
  invalidationHandler_ = nullptr;
  object_.reset();
  onFinished();
}

bool ClientConnection::takeHello() { return !std::exchange(saidHello_, true); }

void ClientConnection::sendReturn(std::uint32_t serial, std::string_view signature,
                                  const Value& value) {
  SocketStream& out = stream();
  const dbus::ReplyTo replyTo{.serial = serial, .destination = replyDestination()};
  if (!dbus::appendMethodReturn(out.output().bytes(), replyTo, out.nextSerial(), signature,
                                value)) {
    kLog.error("cannot encode the answer to request ", serial, " of ", description(),
               " with the signature \"", std::string(signature), "\"; sending an error");
    sendError(serial, error_names::kFailed,
              "the service cannot encode its answer with the signature \"" +
                  std::string(signature) + "\"");
    return;
  }
  out.output().frameAppended();
  out.outputAdded();
}

void ClientConnection::sendServiceError(std::uint32_t serial, const Error& error) {
  const std::string name =
      error.name.empty() ? error.domain + ".Code" + std::to_string(error.code) : error.name;
  sendError(serial, name, error.description);
}

void ClientConnection::sendError(std::uint32_t serial, std::string_view name,
                                 std::string_view text) {
  SocketStream& out = stream();
  const dbus::ReplyTo replyTo{.serial = serial, .destination = replyDestination()};
  std::string& bytes = out.output().bytes();
  if (!dbus::appendError(bytes, replyTo, out.nextSerial(), name, text) &&
      !dbus::appendError(bytes, replyTo, out.nextSerial(), error_names::kFailed,
                         "the service cannot encode the error that it answers")) {
    return;
  }
  out.output().frameAppended();
  out.outputAdded();
}

void ClientConnection::refuse(const dbus::MessageHeader& request, Refusal reason,
                              std::string_view errorName, const std::string& text) {
  host_.statistics().refused[static_cast<std::size_t>(reason)]->add();
  const std::uint32_t bit = std::uint32_t{1} << static_cast<unsigned>(reason);
  if ((loggedRefusals_ & bit) == 0) {
    loggedRefusals_ |= bit;
    kLog.notice("refused a request of ", description(), ": ", text);
  } else {
    ++unloggedRefusals_;
  }
  if ((request.flags & dbus::kNoReplyExpected) != 0) return;
  host_.statistics().repliesGiven.add();
  sendError(request.serial, errorName, text);
}

void ClientConnection::onMalformed(const std::string& what) {
  kLog.error("disconnecting ", description(), ": not a valid D-Bus message: ", what);
  host_.statistics().connectionsMalformed.add();
  end(Why::kClosedHere);
}

}  // namespace halvox::platform::linux_
