#pragma once

#include <deque>
#include <functional>
#include <thread>

#include "platform/dispatch.h"
#include "platform/linux/base/Mutex.h"

namespace halvox::platform::linux_ {

// The thread on which a real-time framework without threads of its own calls its callbacks: one
// after the other, in the order in which they were given. It is made when there is something to
// call and ends when nothing is left, so that an idle service has none.
//
// Any thread may call. Does not own the dispatch service, which must be there whenever call() is:
// where the system has no thread to give, its background queue calls.
class CallbackThread {
 public:
  using Callback = std::function<void()>;

  explicit CallbackThread(DispatchService& dispatch) : dispatch_(dispatch) {}
  CallbackThread(const CallbackThread&) = delete;
  CallbackThread& operator=(const CallbackThread&) = delete;
  ~CallbackThread() { stop(); }

  // Calls back later and never on the calling thread; drops the callback after stop().
  void call(Callback callback) HALVOX_EXCLUDES(mutex_);
  // Waits until everything was called. May be called again; not from a callback.
  void stop() HALVOX_EXCLUDES(mutex_);

 private:
  void run() HALVOX_EXCLUDES(mutex_);
  [[nodiscard]] bool provideThread() HALVOX_REQUIRES(mutex_);

  DispatchService& dispatch_;
  Mutex mutex_;
  std::deque<Callback> waiting_ HALVOX_GUARDED_BY(mutex_);
  bool isRunning_ HALVOX_GUARDED_BY(mutex_) = false;  // the thread looks again before it ends
  bool isStopped_ HALVOX_GUARDED_BY(mutex_) = false;
  std::thread thread_ HALVOX_GUARDED_BY(mutex_);
};

}  // namespace halvox::platform::linux_
