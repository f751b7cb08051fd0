#pragma once

#include <cstdint>

#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/connection/Deadlines.h"
#include "platform/linux/connection/EventLoop.h"

namespace halvox::platform::linux_ {

class ConnectionHost;

// A listening socket whose connections the host serves.
//
//   accepting --no descriptor is left--> paused --a connection ends, or a second passes-->
//   accepting
//
// While accepting is paused, the loop does not watch the socket: the socket stays readable, and its
// level-triggered event would make the loop spin. New clients wait in the socket's backlog. Belongs
// to the I/O thread. Owned by the host.
class ListeningSocket final : public EventSource, private DeadlineOwner {
 public:
  // Does not own the host, which must outlive this.
  ListeningSocket(UniqueFd fd, ConnectionHost& host);
  ListeningSocket(const ListeningSocket&) = delete;
  ListeningSocket& operator=(const ListeningSocket&) = delete;

  // Returns false if the socket cannot be watched.
  [[nodiscard]] bool start();
  // Accepts again if accepting has stopped for lack of descriptors. Called when a connection of the
  // service has closed its descriptor.
  void tryAgain();
  void onReady(std::uint32_t events) override;

 private:
  void onDeadline() override { tryAgain(); }
  // Returns false if no more connections can be accepted now.
  bool acceptOne();
  void waitForDescriptors(int error);

  UniqueFd fd_;
  ConnectionHost& host_;
  Deadline retry_;
  bool isWaiting_ = false;
  bool isShort_ = false;  // descriptors ran out, and no accept has succeeded since
};

}  // namespace halvox::platform::linux_
