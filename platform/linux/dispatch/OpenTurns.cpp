#include "platform/linux/dispatch/OpenTurns.h"

namespace halvox::platform::linux_ {

bool OpenTurns::waitUntilNone(std::chrono::steady_clock::time_point deadline) {
  // Set this before reading open_. From here on, the last turn that ends calls reportNone().
  isAwaited_.store(true);
  const MutexLock lock(mutex_);
  while (open_.load() > 0 && none_.waitUntil(mutex_, deadline)) {
  }
  return open_.load() <= 0;
}

void OpenTurns::reportNone() {
  const MutexLock lock(mutex_);
  none_.notifyAll();
}

}  // namespace halvox::platform::linux_
