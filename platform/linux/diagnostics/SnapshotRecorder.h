#pragma once

#include <filesystem>

#include "platform/value.h"

namespace halvox::platform::linux_ {

// Keeps a record of each snapshot. Called on the thread that takes snapshots; must not block on
// more than a lock.
class SnapshotRecorder {
 public:
  virtual ~SnapshotRecorder() = default;
  virtual void recordSnapshot(Date time, const Dictionary& signature,
                              const std::filesystem::path& path) = 0;
};

}  // namespace halvox::platform::linux_
