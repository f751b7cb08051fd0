#pragma once

#include <cstddef>
#include <span>
#include <string>

#include "platform/linux/connection/ClientConnection.h"
#include "platform/linux/connection/Deadlines.h"

namespace halvox::platform::linux_ {

class BusConnection;

// One sender on the bus, a connection of its own. Its requests come through the bus's connection
// and wait here until the bus has said who the sender is and while the sender is held back. The
// bus cannot be asked to hold one sender back, so what goes beyond kMaxWaitingBytesOfSender is
// refused; what the sender does not read of its answers is kept, and bounded, by the bus.
// A sender that is gone before the bus could say who it is is served as process 0 of no user.
class BusSender final : public ClientConnection, private DeadlineOwner {
 public:
  BusSender(ConnectionHost& host, BusConnection& bus, std::string name);

  [[nodiscard]] std::string description() const override;
  [[nodiscard]] bool isPeerToPeer() const override { return false; }
  [[nodiscard]] const std::string& name() const { return name_; }

  // One whole request, or the header of one that is too large.
  void receive(const dbus::MessageHeader& header, std::span<const std::byte> frame);
  void receiveOversized(const FrameBuffer::Next& next);
  // Delivers what has been received, unless the sender has to wait.
  void deliverReceived();
  // The bus has said who the sender is, as far as it knows.
  void onCredentials(const PeerCredentials& credentials);
  // The bus says that nobody has the name any more.
  void onVanished();
  void onBusLost();
  // The bus has taken some of what it is sent.
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
