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

// An answer that was given on another thread.
struct PostedReply {
  std::shared_ptr<ReplyTicket> ticket;
  std::unique_ptr<Error> error;  // none for a success
  Value value;
};

// What the other threads have for the I/O thread.
struct Mail {
  std::vector<PostedReply> replies;
  std::vector<std::shared_ptr<ClientLink>> clientsWithRoom;
  bool relieved = false;
  bool stopAsked = false;

  [[nodiscard]] bool isEmpty() const;
  void clear();
};

// The way from any thread to the I/O thread. Whatever is posted while the I/O thread is awake
// costs no system call; the first post while it sleeps wakes it.
// Shared by the service and by everything that may outlive it; once closed it drops what is posted.
// Bounded by what is open: one answer a request, one room a client.
class Inbox final : public EventSource {
 public:
  Inbox();
  // False when the system gave no descriptor for it.
  [[nodiscard]] bool watchWith(EventLoop& loop);

  // From any thread.
  void postReply(PostedReply reply);
  void postRoom(std::shared_ptr<ClientLink> client);
  void postRelief();
  void postStop();
  // True on the thread that carries the loop out right now.
  [[nodiscard]] bool isLoopThread() const;

  // On the I/O thread.
  void attachToThisThread();
  void close();
  // Says that the loop is going to sleep. False when there is mail, so that it must not.
  [[nodiscard]] bool trySleep();
  void awake();
  // Swaps the mail with `into`, which must be empty.
  void take(Mail& into);
  void onReady(std::uint32_t events) override;

 private:
  template <typename Add>
  void post(const Add& add);

  UniqueFd event_;
  std::atomic<std::thread::id> loopThread_;  // orders with nothing: only equality to oneself counts
  Mutex mutex_;
  Mail mail_ HALVOX_GUARDED_BY(mutex_);
  bool sleeping_ HALVOX_GUARDED_BY(mutex_) = false;
  bool closed_ HALVOX_GUARDED_BY(mutex_) = false;
};

}  // namespace halvox::platform::linux_
