#pragma once

#include <deque>
#include <functional>
#include <thread>

#include "platform/dispatch.h"
#include "platform/linux/base/Mutex.h"

namespace halvox::platform::linux_ {

// Calls the callbacks of link back-ends that have no thread of their own, one after the other in
// the order of call(). The thread starts for the first callback and ends when none is left. An idle
// service therefore has no such thread. If the system cannot start a thread, the background queue
// of `dispatch` calls the callbacks.
// Threads: any may call. Owner: the platform, which also owns `dispatch`; `dispatch` must exist
// during call().
class CallbackThread {
 public:
  using Callback = std::function<void()>;

  explicit CallbackThread(DispatchService& dispatch) : dispatch_(dispatch) {}
  CallbackThread(const CallbackThread&) = delete;
  CallbackThread& operator=(const CallbackThread&) = delete;
  ~CallbackThread() { stop(); }

  // Calls `callback` later, never on the calling thread. Drops it after stop(). Never blocks.
  void call(Callback callback) HALVOX_EXCLUDES(mutex_);
  // Waits until all callbacks have run. May be called again. Must not be called from a callback.
  void stop() HALVOX_EXCLUDES(mutex_);

 private:
  void run() HALVOX_EXCLUDES(mutex_);
  [[nodiscard]] bool provideThread() HALVOX_REQUIRES(mutex_);

  DispatchService& dispatch_;
  Mutex mutex_;
  std::deque<Callback> waiting_ HALVOX_GUARDED_BY(mutex_);
  bool isRunning_ HALVOX_GUARDED_BY(mutex_) =
      false;  // the thread checks waiting_ again before it ends
  bool isStopped_ HALVOX_GUARDED_BY(mutex_) = false;
  std::thread thread_ HALVOX_GUARDED_BY(mutex_);
};

}  // namespace halvox::platform::linux_
