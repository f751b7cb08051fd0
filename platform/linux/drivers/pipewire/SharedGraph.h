#pragma once

#include <memory>

#include "platform/linux/base/Mutex.h"
#include "platform/linux/drivers/pipewire/GraphStatistics.h"

namespace halvox::platform::linux_ {

// What the thread of readings and the thread that follows the server share. Owned by the source,
// outlives the connection.
struct SharedGraph {
  Mutex mutex{};
  Condition settled{};
  GraphStatistics statistics HALVOX_GUARDED_BY(mutex){};
  // Held by all readings that somebody holds.
  std::weak_ptr<void> lease HALVOX_GUARDED_BY(mutex){};
  bool isSettled HALVOX_GUARDED_BY(mutex) = false;  // the server was asked once, or is not there
  bool isProfiling HALVOX_GUARDED_BY(mutex) = false;
};

}  // namespace halvox::platform::linux_
