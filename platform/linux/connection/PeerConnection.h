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

// A client on a socket of its own. First the handshake, then requests; both must be finished in
// time once they are begun, or the connection is closed with a line in the log. An idle connection
// has no deadline and no buffer.
class PeerConnection final : public ClientConnection, private StreamOwner, private DeadlineOwner {
 public:
  PeerConnection(ConnectionHost& host, std::uint64_t number, UniqueFd fd,
                 const PeerCredentials& credentials);

  // Begins to read; what comes before resume() is taken no further than the handshake.
  void start();
  [[nodiscard]] std::string description() const override;
  [[nodiscard]] bool isPeerToPeer() const override { return true; }

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

  // True when messages follow.
  bool continueHandshake();

  SocketStream stream_;
  std::unique_ptr<dbus::ServerHandshake> handshake_;  // none once it is done
  Deadline deadline_;
  bool peerClosed_ = false;
};

}  // namespace halvox::platform::linux_
