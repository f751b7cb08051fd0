#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <span>
#include <string>
#include <string_view>
#include <unordered_map>
#include <vector>

#include "platform/linux/connection/BusConnector.h"
#include "platform/linux/connection/FrameBuffer.h"
#include "platform/linux/connection/SocketStream.h"
#include "platform/linux/connection/wire/Frame.h"

namespace halvox::platform::linux_ {

class BusSender;
class ConnectionHost;

// Our connection to a bus: hands each sender's requests to a BusSender of its own, and asks the bus
// who the sender is. Belongs to the I/O thread.
// When the bus is lost all senders end, with an error line, and it is not connected to again.
class BusConnection final : private StreamOwner {
 public:
  // Does not own the host, which must outlive this.
  BusConnection(ConnectionHost& host, BusSession session);
  BusConnection(const BusConnection&) = delete;
  BusConnection& operator=(const BusConnection&) = delete;
  ~BusConnection() override;

  void start();
  // Lets go of all senders without their handlers: the service itself ends.
  void abandon();

  // For senders.
  [[nodiscard]] SocketStream& stream() { return stream_; }
  void forget(const BusSender& sender);
  void noteWaitingSender() { someSenderWaits_ = true; }

 private:
  void onReadable() override;
  void onOutputProgress() override;
  void handleFrames();
  void handleFrame(const FrameBuffer::Next& next);
  void handleOversized(const FrameBuffer::Next& next);
  void handleSignal(const dbus::Frame& frame);
  void handleAnswer(const dbus::Frame& frame);
  std::shared_ptr<BusSender> senderNamed(std::string_view name);
  void lose(const std::string& why);

  ConnectionHost& host_;
  SocketStream stream_;
  std::map<std::string, std::shared_ptr<BusSender>, std::less<>> senders_;
  std::unordered_map<std::uint32_t, std::weak_ptr<BusSender>> questions_;  // by serial
  std::vector<std::shared_ptr<BusSender>> touched_;  // senders with new requests in this read
  bool someSenderWaits_ = false;
  bool lost_ = false;
};

}  // namespace halvox::platform::linux_
