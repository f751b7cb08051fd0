#include "platform/linux/link/local/CallbackThread.h"

#include <chrono>
#include <system_error>
#include <utility>

#include "platform/linux/base/ThreadSetup.h"

namespace halvox::platform::linux_ {

void CallbackThread::call(Callback callback) {
  {
    const MutexLock lock(mutex_);
    if (isStopped_) return;
    if (isRunning_ || provideThread()) {
      waiting_.push_back(std::move(callback));
      return;
    }
  }
  // The system cannot start a thread. Use the background queue, because even then the callback must
  // not run on the caller's thread.
  dispatch_.asyncAfterOnBackgroundQueue(std::chrono::nanoseconds(0), std::move(callback));
}

void CallbackThread::stop() {
  std::thread last;
  {
    const MutexLock lock(mutex_);
    isStopped_ = true;
    // Join without the lock, which the thread needs in order to end.
    last = std::move(thread_);
  }
  if (last.joinable()) last.join();
}

// Returns false if the system cannot start a thread.
bool CallbackThread::provideThread() {
  // If there is an earlier thread, it has released the lock for the last time, and join() returns
  // at once.
  if (thread_.joinable()) thread_.join();
  try {
    thread_ = std::thread(&CallbackThread::run, this);
  } catch (const std::system_error&) {
    return false;
  }
  isRunning_ = true;
  return true;
}

void CallbackThread::run() {
  setUpThread("link callbacks", ThreadPriority::kUtility);
  while (true) {
    Callback next;
    {
      const MutexLock lock(mutex_);
      if (waiting_.empty()) {
        // End the thread instead of waiting for more callbacks, because they are as rare as starts
        // of sessions.
        isRunning_ = false;
        return;
      }
      next = std::move(waiting_.front());
      waiting_.pop_front();
    }
    next();
  }
}

}  // namespace halvox::platform::linux_
