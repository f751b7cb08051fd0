#pragma once

#include <cstddef>
#include <span>
#include <string>

#include "platform/linux/connection/ClientConnection.h"
#include "platform/linux/connection/Deadlines.h"

namespace halvox::platform::linux_ {

class BusConnection;

// One sender on the bus. Each counts as a connection of its own.
//
//   unknown --credentials, or the handshake timeout--> known: the delegate is asked, requests are
//       delivered --the name vanishes--> ended
//
// Its requests arrive on the bus's connection. They wait here until the bus has said who the sender
// is, and while flow control holds the sender back. The bus cannot hold back one sender: requests
// beyond kMaxWaitingBytesOfSender are refused. Replies that the sender does not read are kept and
// bounded by the bus. A sender that left before the bus could answer is served as process 0 of an
// unknown user, because some of its requests may need no reply. Belongs to the I/O thread. Shared
// by the bus's connection and the delegate.
class BusSender final : public ClientConnection, private DeadlineOwner {
 public:
  BusSender(ConnectionHost& host, BusConnection& bus, std::string name);

  [[nodiscard]] std::string description() const override;
  [[nodiscard]] bool isPeerToPeer() const override { return false; }
  [[nodiscard]] const std::string& name() const { return name_; }

  // A whole request.
  void receive(const dbus::MessageHeader& header, std::span<const std::byte> frame);
  // The header of a request that is larger than the limit.
  void receiveOversized(const FrameBuffer::Next& next);
  // Delivers what has been received, unless flow control holds the sender back.
  void deliverReceived();
  // The bus has given the sender's credentials, or has not answered in time.
  void onCredentials(const PeerCredentials& credentials);
  // The bus reports that the name has lost its owner.
  void onVanished();
  void onBusLost();
  // The bus has read some of the replies.
  void onStreamRoom() { onOutputRoom(); }

 private:
  FrameBuffer& input() override { return input_; }
  SocketStream& stream() override;
  [[nodiscard]] std::string_view replyDestination() const override { return name_; }
  void setReading(bool reading) override;
  void onDelivered(bool begun, bool progress) override;
  void onEnded() override { identity_.stop(); }
  void onFinished() override;
  void onMalformed(const std::string& what) override;
  void onDeadline() override { onCredentials({}); }

  BusConnection& bus_;
  std::string name_;
  FrameBuffer input_;
  Deadline identity_;
  bool isKnown_ = false;
  bool vanished_ = false;
};

}  // namespace halvox::platform::linux_
