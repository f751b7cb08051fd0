#include "platform/linux/connection/BusConnection.h"

#include <array>
#include <utility>
#include <variant>

#include "platform/linux/connection/BusNames.h"
#include "platform/linux/connection/BusSender.h"
#include "platform/linux/connection/ConnectionHost.h"
#include "platform/linux/connection/ConnectionLog.h"
#include "platform/linux/connection/wire/FrameWriter.h"
#include "platform/linux/connection/wire/ValueDecoder.h"

namespace halvox::platform::linux_ {
namespace {

constexpr UnitLog kLog{connectionCategory, "BusConnection"};

// Returns the credentials in the bus's answer. A number that the answer lacks stays unknown. If the
// sender has left, the answer is an error and both numbers stay unknown.
PeerCredentials credentialsIn(const dbus::Frame& answer) {
  std::vector<Value> values;
  if (answer.header.type != dbus::MessageType::kMethodReturn ||
      dbus::decodeBody(answer, "a{sv}", values).has_value()) {
    return {};
  }
  PeerCredentials credentials;
  const Dictionary facts = values[0].dictionary();
  if (const Value* pid = facts.find("ProcessID"); pid != nullptr && pid->isNumber()) {
    credentials.pid = static_cast<ProcessID>(pid->toInt64());
  }
  if (const Value* uid = facts.find("UnixUserID"); uid != nullptr && uid->isNumber()) {
    credentials.uid = static_cast<uid_t>(uid->toUInt64());
  }
  return credentials;
}

}  // namespace

BusConnection::BusConnection(ConnectionHost& host, BusSession session)
    : host_(host), stream_(std::move(session.fd), host, *this) {
  stream_.skipSerials(session.lastSerial);
  stream_.input().append(session.unused);
}

BusConnection::~BusConnection() { abandon(); }

void BusConnection::start() {
  stream_.setReading(true);
  // The connector has already read some messages. The socket does not become readable because of
  // them, and the loop would not call onReadable().
  handleFrames();
  stream_.input().settle();
}

void BusConnection::abandon() {
  lost_ = true;
  const auto senders = std::exchange(senders_, {});
  for (const auto& [name, sender] : senders) sender->abandon();
  stream_.close();
}

void BusConnection::forget(const BusSender& sender) {
  const auto found = senders_.find(sender.name());
  if (found != senders_.end() && found->second.get() == &sender) senders_.erase(found);
}

void BusConnection::onReadable() {
  const SocketStream::Read read = stream_.read();
  handleFrames();
  stream_.input().settle();
  if (read == SocketStream::Read::kEnded) lose("the bus closed the connection");
}

void BusConnection::onOutputProgress() {
  if (lost_ || stream_.output().unsentBytes() > kMaxUnreadReplyBytes / 2) return;
  stream_.setReading(true);
  if (!std::exchange(someSenderWaits_, false)) return;
  for (const auto& [name, sender] : senders_) sender->onStreamRoom();
}

void BusConnection::handleFrames() {
  while (!lost_) {
    const FrameBuffer::Next next = stream_.input().next();
    if (next.state == FrameBuffer::State::kEmpty || next.state == FrameBuffer::State::kPartial) {
      break;
    }
    if (next.state == FrameBuffer::State::kBroken) return lose(next.error.message);
    next.state == FrameBuffer::State::kOversized ? handleOversized(next) : handleFrame(next);
    stream_.input().consume(next.totalBytes);
  }
  // Deliver only after all frames of this read have been sorted by sender. Each sender then gets
  // its share of the turn.
  for (const std::shared_ptr<BusSender>& sender : std::exchange(touched_, {})) {
    sender->deliverReceived();
  }
  // The bus reads our replies at its own pace. While too many are unread, do not read more
  // requests, because each request adds a reply.
  if (stream_.output().unsentBytes() >= kMaxUnreadReplyBytes) stream_.setReading(false);
}

void BusConnection::handleFrame(const FrameBuffer::Next& next) {
  const std::variant<dbus::Frame, dbus::WireError> read = dbus::readFrame(next.bytes);
  if (const auto* error = std::get_if<dbus::WireError>(&read); error != nullptr) {
    return lose(error->message);
  }
  const dbus::Frame& frame = std::get<dbus::Frame>(read);
  switch (frame.header.type) {
    case dbus::MessageType::kMethodCall: {
      std::shared_ptr<BusSender> sender = senderNamed(frame.header.sender);
      sender->receive(frame.header, next.bytes);
      // Only the last element is compared. A sender may therefore be in the list twice, and its
      // second delivery finds nothing.
      if (touched_.empty() || touched_.back() != sender) touched_.push_back(std::move(sender));
      break;
    }
    case dbus::MessageType::kMethodReturn:
    case dbus::MessageType::kError:
      handleAnswer(frame);
      break;
    case dbus::MessageType::kSignal:
      handleSignal(frame);
      break;
  }
}

void BusConnection::handleOversized(const FrameBuffer::Next& next) {
  const std::vector<std::byte> header = FrameBuffer::withoutBody(next);
  const std::variant<dbus::Frame, dbus::WireError> read = dbus::readFrame(header);
  // A frame whose header cannot be read gets no answer, because the header names the sender. A bus
  // does not forward such frames.
  if (const auto* frame = std::get_if<dbus::Frame>(&read); frame != nullptr) {
    senderNamed(frame->header.sender)->receiveOversized(next);
  }
}

void BusConnection::handleSignal(const dbus::Frame& frame) {
  const dbus::MessageHeader& header = frame.header;
  const bool isFromBus = header.sender == bus_names::kBus && header.interface == bus_names::kBus;
  // Any sender can send a signal of this name to us. Only the bus knows which sender has left.
  if (!isFromBus || header.member != "NameOwnerChanged") return;
  std::vector<Value> names;  // the name, its old owner, its new one
  if (dbus::decodeBody(frame, "sss", names).has_value() || !names[2].string().empty()) return;
  const auto found = senders_.find(names[0].string());
  // Copy the pointer to keep the sender alive, because a sender that ends may be removed from the
  // map.
  if (found != senders_.end()) std::shared_ptr(found->second)->onVanished();
}

void BusConnection::handleAnswer(const dbus::Frame& frame) {
  const auto found = questions_.find(frame.header.replySerial);
  if (found == questions_.end()) return;
  const std::shared_ptr<BusSender> sender = found->second.lock();
  questions_.erase(found);
  if (!sender) return;
  sender->onCredentials(credentialsIn(frame));
}

std::shared_ptr<BusSender> BusConnection::senderNamed(std::string_view name) {
  const auto found = senders_.find(name);
  if (found != senders_.end()) return found->second;
  auto sender = std::make_shared<BusSender>(host_, *this, std::string(name));
  senders_.emplace(sender->name(), sender);
  const std::array arguments = {Value(name)};
  const dbus::CallTarget target{.destination = bus_names::kBus,
                                .path = bus_names::kBusPath,
                                .interface = bus_names::kBus,
                                .member = "GetConnectionCredentials"};
  const std::uint32_t serial = stream_.nextSerial();
  if (dbus::appendMethodCall(stream_.output().bytes(), serial, target, "s", arguments)) {
    // Store a weak pointer, because the sender may leave before the bus answers.
    questions_.emplace(serial, sender);
    stream_.outputAdded();
  }
  return sender;
}

void BusConnection::lose(const std::string& why) {
  if (std::exchange(lost_, true)) return;
  kLog.error("lost the bus: ", why, "; disconnecting its ", senders_.size(),
             " clients and serving the socket only");
  stream_.setReading(false);
  // Iterate over a copy, because a sender that ends removes itself from the map.
  const auto senders = senders_;
  for (const auto& [name, sender] : senders) sender->onBusLost();
  questions_.clear();
  stream_.close();
}

}  // namespace halvox::platform::linux_
