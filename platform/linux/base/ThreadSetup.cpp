#include "platform/linux/base/ThreadSetup.h"

#include <algorithm>
#include <csignal>
#include <string>

#include <pthread.h>
#include <sys/resource.h>
#include <unistd.h>

namespace halvox::platform::linux_ {
namespace {

// How much nicer than the main thread: five steps leave about a third of a processor to a thread
// that another one wants too, ten about a tenth. Neither starves, so a lock that such a thread
// holds for a few instructions is given back soon.
int nicenessOf(QualityOfService quality) {
  switch (quality) {
    case QualityOfService::kUserInteractive:
      return 0;
    case QualityOfService::kUtility:
      return 5;
    case QualityOfService::kBackground:
      return 10;
  }
  return 0;
}

}  // namespace

void setUpThread(std::string_view label) {
  constexpr std::size_t kLongestName = 15;
  while (label.size() > kLongestName) {
    const std::size_t dot = label.find('.');
    label.remove_prefix(dot == std::string_view::npos ? label.size() - kLongestName : dot + 1);
  }
  ::pthread_setname_np(::pthread_self(), std::string(label).c_str());
  sigset_t all;
  ::sigfillset(&all);
  ::pthread_sigmask(SIG_BLOCK, &all, nullptr);
}

void setUpThread(std::string_view label, QualityOfService quality) {
  constexpr int kLowestPriority = 19;
  setUpThread(label);
  const int steps = nicenessOf(quality);
  if (steps == 0) return;
  // Of Linux: an ID of a process is that of its main thread, and each thread has its own niceness.
  const int mainThread = ::getpriority(PRIO_PROCESS, static_cast<id_t>(::getpid()));
  ::setpriority(PRIO_PROCESS, static_cast<id_t>(::gettid()),
                std::min(mainThread + steps, kLowestPriority));
}

}  // namespace halvox::platform::linux_
