#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <vector>

namespace halvox::platform::linux_ {

class ClientConnection;
class SocketStream;

// The lists of clients and streams that a turn of the loop works through after it has handled the
// events. Every client gets its share of deliveries, then all outputs are written. A client with
// more than its share continues in the next turn, after the clients that have become readable by
// then. A flood of one client therefore delays the others by at most one share. Belongs to the I/O
// thread. Owned by the host.
class TurnSchedule {
 public:
  // The arguments are the functions of the same names in ConnectionOptions.
  TurnSchedule(std::function<void()> beginBatch, std::function<void()> endBatch,
               std::function<void()> afterReplies);

  // Lets the client deliver in the next turn.
  void deliverNext(std::shared_ptr<ClientConnection> client);
  // Lets the client deliver after the store has caught up.
  void deliverWhenRelieved(std::shared_ptr<ClientConnection> client);
  void flushLater(SocketStream& stream);
  // Finishes a client that has ended, in the next turn. The client's last replies have been written
  // by then.
  void finishNext(std::shared_ptr<ClientConnection> client);
  // Begins the batch of this turn unless it has begun. Call this before anything that can add jobs
  // to a queue: a delivery, a handler, or the question whether to accept a client.
  void beforeDelivery();

  // Returns true if the next turn must not sleep.
  [[nodiscard]] bool hasWork() const;
  // The most requests that may be delivered for one client in this turn.
  [[nodiscard]] std::size_t requestsPerClient() const { return requestsPerClient_; }

  // The parts of a turn, in this order. `readyCount` is the number of sources that had events.
  void begin();
  void deliver(std::size_t readyCount);
  void finishEnded();
  void endDeliveries();
  void relieve();
  void flush();
  // Releases the clients that have finished. Call this last, because events of this turn may still
  // refer to these clients.
  void reap() { finished_.clear(); }
  // Forgets all clients, because the loop has ended.
  void clear();

 private:
  using Clients = std::vector<std::shared_ptr<ClientConnection>>;

  std::function<void()> beginBatch_;
  std::function<void()> endBatch_;
  std::function<void()> afterReplies_;
  bool inBatch_ = false;
  bool hasReplies_ = false;  // the replies of a batch are not written yet
  std::size_t requestsPerClient_;
  Clients due_;   // deliver in this turn
  Clients next_;  // deliver in the next turn
  Clients waitingForRelief_;
  Clients ending_;
  Clients ended_;
  Clients finished_;
  std::vector<SocketStream*> flushing_;
};

}  // namespace halvox::platform::linux_
