#include "platform/linux/connection/Inbox.h"

#include <utility>

#include <sys/epoll.h>
#include <sys/eventfd.h>

#include "platform/linux/connection/ClientLink.h"

namespace halvox::platform::linux_ {

bool Mail::isEmpty() const {
  return replies.empty() && clientsWithRoom.empty() && !relieved && !stopAsked;
}

void Mail::clear() {
  replies.clear();
  clientsWithRoom.clear();
  relieved = false;
  stopAsked = false;
}

Inbox::Inbox() : event_(eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK)) {}

bool Inbox::watchWith(EventLoop& loop) {
  return event_ && loop.watch(event_.get(), EPOLLIN, *this);
}

template <typename Add>
void Inbox::post(const Add& add) {
  bool mustWake = false;
  {
    const MutexLock lock(mutex_);
    if (closed_) return;
    add();
    // Only the first post after the loop fell asleep must wake the loop, which takes a system call.
    mustWake = std::exchange(sleeping_, false);
  }
  if (!mustWake) return;
  const std::uint64_t one = 1;
  // Write after the lock is released, because the loop wakes up at once and takes the lock. The
  // write cannot fail: it happens once for each sleep, and the counter of the eventfd never fills
  // up.
  static_cast<void>(write(event_.get(), &one, sizeof one));
}

void Inbox::postReply(PostedReply reply) {
  post([&]() HALVOX_REQUIRES(mutex_) { mail_.replies.push_back(std::move(reply)); });
}

void Inbox::postRoom(std::shared_ptr<ClientLink> client) {
  post([&]() HALVOX_REQUIRES(mutex_) { mail_.clientsWithRoom.push_back(std::move(client)); });
}

void Inbox::postRelief() {
  post([&]() HALVOX_REQUIRES(mutex_) { mail_.relieved = true; });
}

void Inbox::postStop() {
  post([&]() HALVOX_REQUIRES(mutex_) { mail_.stopAsked = true; });
}

bool Inbox::isLoopThread() const {
  return loopThread_.load(std::memory_order_relaxed) == std::this_thread::get_id();
}

void Inbox::attachToThisThread() { loopThread_ = std::this_thread::get_id(); }

void Inbox::close() {
  // From now on isLoopThread() is false on this thread, too. The thread then posts like any other
  // thread, and the closed inbox drops its posts.
  loopThread_ = std::thread::id();
  Mail dropped;  // destroyed after the lock is released: what it holds may post again
  const MutexLock lock(mutex_);
  closed_ = true;
  std::swap(dropped, mail_);
}

bool Inbox::trySleep() {
  const MutexLock lock(mutex_);
  // Look for posts and set the flag in one critical section. Either this function sees a post, or
  // the post sees that it must wake the loop.
  if (!mail_.isEmpty()) return false;
  sleeping_ = true;
  return true;
}

void Inbox::awake() {
  const MutexLock lock(mutex_);
  sleeping_ = false;
}

void Inbox::take(Mail& into) {
  const MutexLock lock(mutex_);
  std::swap(mail_, into);
}

void Inbox::onReady(std::uint32_t /*events*/) {
  std::uint64_t posts = 0;
  // Only reset the eventfd, because the loop is level-triggered. The loop calls take() later in the
  // turn.
  static_cast<void>(read(event_.get(), &posts, sizeof posts));
}

}  // namespace halvox::platform::linux_
