#pragma once

#include <atomic>
#include <memory>
#include <optional>
#include <thread>
#include <vector>

#include "platform/connection.h"
#include "platform/linux/base/Mutex.h"
#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/connection/EventLoop.h"

namespace halvox::platform::linux_ {

class ClientLink;
class ReplyTicket;

// A reply that was given on another thread.
struct PostedReply {
  std::shared_ptr<ReplyTicket> ticket;
  std::unique_ptr<Error> error;  // null for a success
  Value value;
};

// Everything that other threads have posted to the I/O thread and that the thread has not read yet.
struct Mail {
  std::vector<PostedReply> replies;
  std::vector<std::shared_ptr<ClientLink>> clientsWithRoom;
  bool relieved = false;
  bool stopAsked = false;

  [[nodiscard]] bool isEmpty() const;
  void clear();
};

// Passes replies and notices from any thread to the I/O thread.
//
//   awake --trySleep()--> asleep --the first post writes to the eventfd--> awake ... --close()-->
//   closed: drops what is posted
//
// While the I/O thread is awake, a post costs a lock but no system call, because the thread reads
// the inbox at the end of every turn. While the thread sleeps, only the first post wakes it. Shared
// by the service, replies and requests. Replies and requests may outlive the service. The number of
// posts is bounded: at most one reply for each open request, and for each client one notice that
// its requests have been carried out.
class Inbox final : public EventSource {
 public:
  Inbox();
  // Returns false if the system has no descriptor left.
  [[nodiscard]] bool watchWith(EventLoop& loop);

  // Any thread may call these functions.
  void postReply(PostedReply reply);
  void postRoom(std::shared_ptr<ClientLink> client);
  void postRelief();
  void postStop();
  // Returns true on the thread that runs the loop.
  [[nodiscard]] bool isLoopThread() const;

  // Only the I/O thread may call the following functions.
  void attachToThisThread();
  void close();
  // Announces that the loop is about to sleep. Returns false if a post waits; the loop must then
  // not sleep.
  [[nodiscard]] bool trySleep();
  void awake();
  // Moves all posts to `into`, which must be empty. The two are swapped, and both therefore keep
  // their capacity.
  void take(Mail& into);
  void onReady(std::uint32_t events) override;

 private:
  template <typename Add>
  void post(const Add& add);

  UniqueFd event_;
  std::atomic<std::thread::id> loopThread_;  // relaxed: a thread only compares it with its own ID
  Mutex mutex_;
  Mail mail_ HALVOX_GUARDED_BY(mutex_);
  bool sleeping_ HALVOX_GUARDED_BY(mutex_) = false;
  bool closed_ HALVOX_GUARDED_BY(mutex_) = false;
};

}  // namespace halvox::platform::linux_
