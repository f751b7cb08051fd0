#include "platform/linux/base/ThreadSetup.h"

#include <algorithm>
#include <string>

#include <pthread.h>
#include <sys/resource.h>
#include <unistd.h>

namespace halvox::platform::linux_ {
namespace {

// If two threads compete for a processor, five steps leave about a third of it to the thread with
// the lower priority, and ten steps about a tenth. Neither thread starves. Even the slower one soon
// releases a lock that it holds for a few instructions.
int stepsBelowMainThread(ThreadPriority priority) {
  switch (priority) {
    case ThreadPriority::kNormal:
      return 0;
    case ThreadPriority::kUtility:
      return 5;
    case ThreadPriority::kBackground:
      return 10;
  }
  return 0;
}

sigset_t blockAllSignals() {
  sigset_t all;
  sigset_t previous;
  ::sigfillset(&all);
  ::pthread_sigmask(SIG_SETMASK, &all, &previous);
  return previous;
}

}  // namespace

void setUpThread(std::string_view label) {
  // The kernel does not cut a longer name but refuses it. Keep the end of the label, because all
  // queues share its start.
  constexpr std::size_t kLongestName = 15;
  while (label.size() > kLongestName) {
    const std::size_t dot = label.find('.');
    label.remove_prefix(dot == std::string_view::npos ? label.size() - kLongestName : dot + 1);
  }
  ::pthread_setname_np(::pthread_self(), std::string(label).c_str());
  // The event loop of the connections reads signals from a descriptor. If a thread did not block
  // them, the kernel could deliver them to that thread instead.
  blockAllSignals();
}

void setUpThread(std::string_view label, ThreadPriority priority) {
  constexpr int kLowestPriority = 19;
  setUpThread(label);
  // Relative to the main thread, because the whole service may have been started at a lower
  // priority.
  const int steps = stepsBelowMainThread(priority);
  if (steps == 0) return;
  // On Linux the ID of a process is that of its main thread, and each thread has its own niceness.
  const int mainThread = ::getpriority(PRIO_PROCESS, static_cast<id_t>(::getpid()));
  ::setpriority(PRIO_PROCESS, static_cast<id_t>(::gettid()),
                std::min(mainThread + steps, kLowestPriority));
}

SignalsBlocked::SignalsBlocked() : previous_(blockAllSignals()) {}

SignalsBlocked::~SignalsBlocked() { ::pthread_sigmask(SIG_SETMASK, &previous_, nullptr); }

}  // namespace halvox::platform::linux_
