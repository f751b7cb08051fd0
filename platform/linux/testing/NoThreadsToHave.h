#pragma once

#include <cstddef>

#include <pthread.h>

namespace halvox::platform::linux_ {

// While it exists, no thread can be started, because the default size of stacks is larger than any
// address space.
class NoThreadsToHave {
 public:
  NoThreadsToHave() {
    pthread_getattr_default_np(&usual_);
    pthread_attr_t huge;
    pthread_attr_init(&huge);
    pthread_attr_setstacksize(&huge, std::size_t{1} << 50U);
    pthread_setattr_default_np(&huge);
    pthread_attr_destroy(&huge);
  }
  NoThreadsToHave(const NoThreadsToHave&) = delete;
  NoThreadsToHave& operator=(const NoThreadsToHave&) = delete;
  ~NoThreadsToHave() {
    pthread_setattr_default_np(&usual_);
    pthread_attr_destroy(&usual_);
  }

 private:
  pthread_attr_t usual_{};
};

}  // namespace halvox::platform::linux_
