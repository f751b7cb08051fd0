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

// The service's connection to a bus. Makes a BusSender for each sender on the bus, asks the bus for
// the sender's credentials, and passes the sender's requests to the BusSender.
//
//   started --the bus closes or breaks the rules--> lost: all senders end, an error is logged
//
// The service does not join a lost bus again before its next start: the bus has released our name,
// and another process may own it now. Belongs to the I/O thread. Owned by the host.
class BusConnection final : private StreamOwner {
 public:
  // Does not own the host, which must outlive this.
  BusConnection(ConnectionHost& host, BusSession session);
  BusConnection(const BusConnection&) = delete;
  BusConnection& operator=(const BusConnection&) = delete;
  ~BusConnection() override;

  void start();
  // Releases all senders without calling their handlers. Called when the service ends.
  void abandon();

  // For senders. A sender that waits calls noteWaitingSender(), and continues after the bus has
  // read half of the unread replies.
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
  std::vector<std::shared_ptr<BusSender>> touched_;  // those with requests in this read
  bool someSenderWaits_ = false;
  bool lost_ = false;
};

}  // namespace halvox::platform::linux_
