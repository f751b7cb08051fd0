#pragma once

#include <memory>

#include "platform/linux/base/Mutex.h"
#include "platform/linux/drivers/pipewire/GraphStatistics.h"

namespace halvox::platform::linux_ {

// Shared by the thread of readings and the thread that follows the server. The source owns the
// graph, which outlives the connection.
struct SharedGraph {
  Mutex mutex{};
  Condition settled{};
  GraphStatistics statistics HALVOX_GUARDED_BY(mutex){};
  // Each reading holds a copy. Expired if no reading is held.
  std::weak_ptr<void> lease HALVOX_GUARDED_BY(mutex){};
  bool isSettled HALVOX_GUARDED_BY(mutex) = false;  // the server has answered once, or is missing
  bool isProfiling HALVOX_GUARDED_BY(mutex) = false;
};

}  // namespace halvox::platform::linux_
