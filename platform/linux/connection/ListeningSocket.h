#pragma once

#include <cstdint>

#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/connection/Deadlines.h"
#include "platform/linux/connection/EventLoop.h"

namespace halvox::platform::linux_ {

class ConnectionHost;

// A socket whose connections the host serves. Belongs to the I/O thread.
// When descriptors run out it waits, without looking, until a connection of ours ends or a second
// has passed; the clients meanwhile wait in the socket's backlog.
class ListeningSocket final : public EventSource, private DeadlineOwner {
 public:
  // Does not own the host, which must outlive this.
  ListeningSocket(UniqueFd fd, ConnectionHost& host);
  ListeningSocket(const ListeningSocket&) = delete;
  ListeningSocket& operator=(const ListeningSocket&) = delete;

  // False when the socket cannot be watched.
  [[nodiscard]] bool start();
  // A descriptor was given back.
  void tryAgain();
  void onReady(std::uint32_t events) override;

 private:
  void onDeadline() override { tryAgain(); }
  // False when there is nothing more to accept now.
  bool acceptOne();
  void waitForDescriptors(int error);

  UniqueFd fd_;
  ConnectionHost& host_;
  Deadline retry_;
  bool isWaiting_ = false;
  bool isShort_ = false;  // descriptors ran out and none was got since
};

}  // namespace halvox::platform::linux_
