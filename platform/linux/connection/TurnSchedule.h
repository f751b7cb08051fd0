#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <vector>

namespace halvox::platform::linux_ {

class ClientConnection;
class SocketStream;

// Whose turn it is: what each turn of the loop does besides taking events.
// In one turn every client gets its share of deliveries, then all that was added to outputs is
// written. Clients that have more than their share come again in the next turn, after those that
// have just become readable. Belongs to the I/O thread.
class TurnSchedule {
 public:
  // The hooks of ConnectionOptions.
  TurnSchedule(std::function<void()> beginBatch, std::function<void()> endBatch,
               std::function<void()> afterReplies);

  // Lets a client deliver in the next turn. Once for each time it says so.
  void deliverNext(std::shared_ptr<ClientConnection> client);
  // Lets a client deliver once the consumer that is behind has caught up.
  void deliverWhenRelieved(std::shared_ptr<ClientConnection> client);
  void flushLater(SocketStream& stream);
  // Lets a client that has ended finish in the next turn, after its last replies were written.
  void finishNext(std::shared_ptr<ClientConnection> client);
  // Call it before anything that reaches the service: a delivery, a handler, an acceptance.
  void beforeDelivery();

  // True when the next turn must not wait.
  [[nodiscard]] bool hasWork() const;
  // How many requests each client may have delivered in this turn.
  [[nodiscard]] std::size_t requestsPerClient() const { return requestsPerClient_; }

  // The parts of a turn, in order. `readyCount` is how many sources had events.
  void begin();
  void deliver(std::size_t readyCount);
  void finishEnded();
  void endDeliveries();
  void relieve();
  void flush();
  // Drops the clients that have finished. Nothing of this turn refers to them any more.
  void reap() { finished_.clear(); }
  // Forgets everybody: the loop has ended.
  void clear();

 private:
  using Clients = std::vector<std::shared_ptr<ClientConnection>>;

  std::function<void()> beginBatch_;
  std::function<void()> endBatch_;
  std::function<void()> afterReplies_;
  bool inBatch_ = false;
  bool hasReplies_ = false;  // of a batch, not written yet
  std::size_t requestsPerClient_;
  Clients due_;   // this turn
  Clients next_;  // the next one
  Clients waitingForRelief_;
  Clients ending_;
  Clients ended_;
  Clients finished_;
  std::vector<SocketStream*> flushing_;
};

}  // namespace halvox::platform::linux_
