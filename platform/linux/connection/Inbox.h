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

// What other threads have posted to the I/O thread.
struct Mail {
  std::vector<PostedReply> replies;
  std::vector<std::shared_ptr<ClientLink>> clientsWithRoom;
  bool relieved = false;
  bool stopAsked = false;

  [[nodiscard]] bool isEmpty() const;
  void clear();
};

// The way from any thread to the I/O thread.
//
//   awake --trySleep()--> asleep --the first post writes to the eventfd--> awake ... --close()-->
//   closed: drops what is posted
//
// While the I/O thread is awake, a post costs a lock but no system call: the thread reads its mail
// at the end of every turn. While the thread sleeps, only the first post wakes it. Shared by the
// service and by replies and requests, which may outlive it. The number of letters is bounded: at
// most one reply for each open request and one notice of room for each client.
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
  // Announces that the loop is about to sleep. Returns false if there is mail: the loop must then
  // not sleep.
  [[nodiscard]] bool trySleep();
  void awake();
  // Swaps the mail with `into`, which must be empty. Swapping keeps the capacity of both sides.
  void take(Mail& into);
  void onReady(std::uint32_t events) override;

 private:
  template <typename Add>
  void post(const Add& add);

  UniqueFd event_;
  std::atomic<std::thread::id> loopThread_;  // relaxed: a thread only compares it with itself
  Mutex mutex_;
  Mail mail_ HALVOX_GUARDED_BY(mutex_);
  bool sleeping_ HALVOX_GUARDED_BY(mutex_) = false;
  bool closed_ HALVOX_GUARDED_BY(mutex_) = false;
};

}  // namespace halvox::platform::linux_
