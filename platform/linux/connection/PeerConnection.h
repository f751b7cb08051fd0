#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <string_view>

#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/connection/ClientConnection.h"
#include "platform/linux/connection/Deadlines.h"
#include "platform/linux/connection/SocketStream.h"
#include "platform/linux/connection/wire/Handshake.h"

namespace halvox::platform::linux_ {

// A client on the service's own socket.
//
//   handshake --BEGIN--> requests --the peer closes, or breaks the rules--> ended
//       \--not complete in time--> ended      \--a frame is not complete in time--> ended
//
// A handshake or frame that has begun must be complete within a timeout. Without the timeouts, a
// client could hold a descriptor and memory forever by sending half of a message. An idle
// connection has no deadline and no buffer. Belongs to the I/O thread. Shared by the host, the
// lists of its turn and the delegate.
class PeerConnection final : public ClientConnection, private StreamOwner, private DeadlineOwner {
 public:
  PeerConnection(ConnectionHost& host, std::uint64_t number, UniqueFd fd,
                 const PeerCredentials& credentials);

  // Starts to read. Before resume() only the handshake is handled, not requests.
  void start();
  [[nodiscard]] std::string description() const override;
  [[nodiscard]] bool isPeerToPeer() const override { return true; }
  // Tells the client that the service ends, and which of its requests was the last that the service
  // has taken. The client can then send the later ones to the next service, none of them twice.
  // Called at an orderly end, before abandon(). Does not wait for a client whose socket is full.
  void sayGoodbye();

 private:
  FrameBuffer& input() override { return stream_.input(); }
  SocketStream& stream() override { return stream_; }
  [[nodiscard]] std::string_view replyDestination() const override { return {}; }
  void setReading(bool reading) override;
  void onDelivered(bool begun, bool progress) override;
  void onEnded() override;
  void onFinished() override;

  void onReadable() override;
  void onOutputProgress() override { onOutputRoom(); }
  void onDeadline() override;

  // Returns true if the handshake is complete and messages follow.
  bool continueHandshake();

  SocketStream stream_;
  std::unique_ptr<dbus::ServerHandshake> handshake_;  // null after the handshake
  Deadline deadline_;
  bool peerClosed_ = false;
};

}  // namespace halvox::platform::linux_
