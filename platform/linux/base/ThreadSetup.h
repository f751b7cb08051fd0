#pragma once

#include <csignal>
#include <cstdint>
#include <string_view>

namespace halvox::platform::linux_ {

// How far the priority of a thread is below that of the threads that requests wait for.
enum class ThreadPriority : std::uint8_t {
  kNormal,
  kUtility,    // 5 steps of niceness below the main thread
  kBackground  // 10 steps below it
};

// Each thread of ours calls this first. It gives the thread the name that tools show: the last
// words of a dotted label that fit into 15 bytes. It also blocks all signals, which the main thread
// handles.
void setUpThread(std::string_view label);

// Does the same, and lowers the priority of the calling thread, which cannot raise it again. Work
// that must be fast must not wait for such a thread.
void setUpThread(std::string_view label, ThreadPriority priority);

// Blocks all signals for the calling thread while this object exists. A new thread inherits the
// signal mask of the thread that creates it. A thread that is created meanwhile therefore never
// receives a signal, not even before setUpThread(). A library needs this when it creates a thread
// in another program, because that program's signals must go to its own threads.
class SignalsBlocked {
 public:
  SignalsBlocked();
  ~SignalsBlocked();
  SignalsBlocked(const SignalsBlocked&) = delete;
  SignalsBlocked& operator=(const SignalsBlocked&) = delete;

 private:
  sigset_t previous_{};
};

}  // namespace halvox::platform::linux_
