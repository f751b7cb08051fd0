#include "platform/linux/runtime/ThreadSetup.h"

#include <csignal>
#include <string>

#include <pthread.h>

namespace halvox::platform::linux_ {

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

}  // namespace halvox::platform::linux_
