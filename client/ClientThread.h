#pragma once

#include <functional>

#include <pthread.h>

namespace halvox::client {

// The thread of a client, with a stack of 512 KiB. The client is made for programs that call
// mlockall(MCL_FUTURE). In such a program all 8 MiB of a default stack would be resident. If the C
// library needs more than 512 KiB, because the program has many thread-local variables, the thread
// gets a stack of the default size.
//
//   empty ──start()──► running ──destruction──► joined
//                         └──────abandon()────► empty
//
// Several threads of the owner may call isCurrent() at the same time. All other functions belong to
// one thread.
class ClientThread {
 public:
  ClientThread() = default;
  // Waits until `work` has returned.
  ~ClientThread();
  ClientThread(const ClientThread&) = delete;
  ClientThread& operator=(const ClientThread&) = delete;

  // Runs `work` on a new thread. Call it once. Throws std::system_error if no thread can be
  // started, or std::bad_alloc. `work` must not throw.
  void start(std::function<void()> work);
  // Returns true if the calling thread is this thread.
  [[nodiscard]] bool isCurrent() const;
  // Call this in a child process after fork(), where the thread does not exist. The destructor then
  // does not wait for it.
  void abandon() { isRunning_ = false; }

 private:
  bool isRunning_ = false;
  pthread_t thread_{};
};

}  // namespace halvox::client
