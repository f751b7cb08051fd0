#pragma once

#include <csignal>
#include <cstdint>
#include <string_view>

namespace halvox::platform::linux_ {

// How much a thread gives way to those that requests wait for.
enum class ThreadPriority : std::uint8_t {
  kNormal,
  kUtility,    // 5 steps of niceness below the main thread
  kBackground  // 10 steps below it
};

// What each thread of ours does first. It takes the name that tools show: of a dotted label the
// last words that fit into 15 bytes. It leaves all signals to the main thread.
void setUpThread(std::string_view label);

// The same, and lowers the priority of the calling thread. A thread cannot raise it again. Nothing
// that must be fast may wait for such a thread.
void setUpThread(std::string_view label, ThreadPriority priority);

// Blocks all signals for the calling thread while it lives. A thread inherits the signal mask of
// the one that creates it, so one that is created meanwhile never takes a signal, not even before
// setUpThread(). A library needs this when it creates a thread in another program: that program's
// signals must go to its own threads.
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
