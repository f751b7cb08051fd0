#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "platform/connection.h"
#include "platform/linux/connection/ConnectionStatistics.h"
#include "platform/linux/connection/Deadlines.h"
#include "platform/linux/connection/EventLoop.h"
#include "platform/linux/connection/FrameBuffer.h"
#include "platform/linux/connection/Inbox.h"
#include "platform/linux/connection/LinuxConnectionService.h"
#include "platform/linux/connection/OutputQueue.h"
#include "platform/linux/connection/RequestDispatcher.h"
#include "platform/linux/connection/SocketFile.h"
#include "platform/linux/connection/TurnSchedule.h"
#include "platform/linux/connection/Watchdog.h"
#include "platform/linux/connection/wire/Frame.h"

namespace halvox::platform::linux_ {

class BusConnection;
class ListeningSocket;
class PeerConnection;
class SignalWatch;
struct PeerCredentials;

// The parts that all connections of one service share, and the loop that serves the connections.
//
//   made --open()--> open --resume()--> serving --requestStop() or a signal--> shut down
//
// One turn of the loop does the following. The order matters:
//   1. takes events: accepts, reads, decodes and delivers requests
//   2. delivers for the clients that had more than their share in the last turn
//   3. calls the handlers of connections that have ended
//   4. ends the batch: this thread now runs the brief jobs that it has queued (docs/decisions/0002)
//   5. reads the inbox: what other threads have posted
//   6. writes: one system call for each connection with output. All replies of the turn leave
//      together, including those of helped jobs and of other threads
//   7. wakes the pool for the queues that the jobs used
//
// The host belongs to the I/O thread, which is the thread that calls resume(). Any thread may call
// requestStop(). Owned by the connection service.
class ConnectionHost final : public NSXPCListener {
 public:
  ConnectionHost(ConnectionOptions options, Backpressure& backpressure);
  ~ConnectionHost() override;

  Result<void, ConnectionOpenError> open();
  void setDelegate(NSXPCListenerDelegate& delegate) override { delegate_ = &delegate; }
  void resume() override;
  void requestStop() { inbox_->postStop(); }

  // The parts that connections use.
  [[nodiscard]] const ConnectionOptions& options() const { return options_; }
  [[nodiscard]] const ServiceIdentity& identity() const { return identity_; }
  [[nodiscard]] Backpressure& backpressure() { return backpressure_; }
  [[nodiscard]] EventLoop& loop() { return loop_; }
  [[nodiscard]] TurnSchedule& turn() { return turn_; }
  [[nodiscard]] const ReadScratch& scratch() const { return scratch_; }
  [[nodiscard]] OutputBufferPool& outputBuffers() { return outputBuffers_; }
  [[nodiscard]] const std::shared_ptr<Inbox>& inbox() const { return inbox_; }
  // The recent headers of requests. The texts of a header from this cache are valid until the next
  // header is read.
  [[nodiscard]] dbus::HeaderCache& headers() { return headers_; }
  [[nodiscard]] RequestDispatcher& dispatcher() { return *dispatcher_; }
  [[nodiscard]] ConnectionStatistics& statistics() { return *statistics_; }
  [[nodiscard]] const std::shared_ptr<ConnectionStatistics>& sharedStatistics() const {
    return statistics_;
  }
  [[nodiscard]] DeadlineQueue& handshakes() { return handshakes_; }
  [[nodiscard]] DeadlineQueue& messages() { return messages_; }
  [[nodiscard]] DeadlineQueue& acceptRetries() { return acceptRetries_; }

  // Called when a client has connected. admit() asks the delegate, and returns false if the
  // delegate refuses the client. acceptPeer() makes the connection of a peer and calls admit().
  void acceptPeer(UniqueFd fd, const PeerCredentials& credentials);
  [[nodiscard]] bool admit(const std::shared_ptr<ClientConnection>& client);
  // Returns the numbers of clients: 1, 2, ...
  [[nodiscard]] std::uint64_t nextClientNumber() { return ++lastClientNumber_; }
  // Called when the descriptor of a peer was closed.
  void peerClosed(PeerConnection& peer);

 private:
  Result<void, ConnectionOpenError> openLoop();
  Result<void, ConnectionOpenError> openSockets();
  Result<void, ConnectionOpenError> openBuses();
  Result<void, ConnectionOpenError> joinBus(const std::string& address);
  void takeTurn();
  void expireDeadlines();
  [[nodiscard]] std::optional<DeadlineQueue::Clock::time_point> firstDeadline() const;
  [[nodiscard]] bool maySleep();
  void readMail();
  void shutDown();

  ConnectionOptions options_;
  Backpressure& backpressure_;
  ServiceIdentity identity_;
  std::shared_ptr<ConnectionStatistics> statistics_;  // shared with the links of clients
  std::shared_ptr<Inbox> inbox_;                      // shared with the links of clients
  EventLoop loop_;
  LoopTimer timer_;
  DeadlineQueue handshakes_;
  DeadlineQueue messages_;
  DeadlineQueue acceptRetries_;
  Watchdog watchdog_;
  ReadScratch scratch_;
  dbus::HeaderCache headers_;
  OutputBufferPool outputBuffers_;
  std::unique_ptr<RequestDispatcher> dispatcher_;
  TurnSchedule turn_;
  Mail mail_;
  NSXPCListenerDelegate* delegate_ = nullptr;
  std::unique_ptr<SignalWatch> signals_;
  SocketFile socketFile_;
  std::vector<std::unique_ptr<ListeningSocket>> listeners_;
  std::unordered_map<const PeerConnection*, std::shared_ptr<PeerConnection>> peers_;
  std::vector<std::unique_ptr<BusConnection>> buses_;
  std::uint64_t lastClientNumber_ = 0;
  bool stopping_ = false;
};

}  // namespace halvox::platform::linux_
