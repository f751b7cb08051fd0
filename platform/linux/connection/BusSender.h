#pragma once

#include <cstddef>
#include <span>
#include <string>

#include "platform/linux/connection/ClientConnection.h"
#include "platform/linux/connection/Deadlines.h"

namespace halvox::platform::linux_ {

class BusConnection;

// One sender on the bus. To the service, each sender is a client connection of its own.
//
//   unknown --credentials, or the handshake timeout--> known: the delegate is asked, requests are
//       delivered --the name vanishes--> ended
//
// The sender's requests arrive on the connection of the bus. They wait here until the bus has sent
// the sender's credentials, and while flow control holds the sender back. The service cannot stop
// reading from one sender alone, because all senders share the connection. It therefore refuses
// requests beyond kMaxWaitingBytesOfSender. The bus stores, and bounds, the replies that the sender
// does not read. If a sender leaves before the bus has sent its credentials, its requests are
// served as those of process 0 of an unknown user: some of them may need no reply. Belongs to the
// I/O thread. Shared by the bus's connection and the delegate.
class BusSender final : public ClientConnection, private DeadlineOwner {
 public:
  BusSender(ConnectionHost& host, BusConnection& bus, std::string name);

  [[nodiscard]] std::string description() const override;
  [[nodiscard]] bool isPeerToPeer() const override { return false; }
  [[nodiscard]] const std::string& name() const { return name_; }

  // A whole request.
  void receive(const dbus::MessageHeader& header, std::span<const std::byte> frame);
  // Takes the header of a request that is larger than the limit, and refuses the request.
  void receiveOversized(const FrameBuffer::Next& next);
  // Delivers the requests that have been received, unless flow control holds the sender back.
  void deliverReceived();
  // Called when the bus has sent the sender's credentials or has not answered in time.
  void onCredentials(const PeerCredentials& credentials);
  // Called when the bus reports that the sender has left.
  void onVanished();
  void onBusLost();
  // Called when the bus has read some of the replies.
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
