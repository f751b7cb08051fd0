#pragma once

#include <filesystem>

#include "platform/value.h"

namespace halvox::platform::linux_ {

// Keeps a record of each snapshot that was published. The platform owns it; it outlives the service
// that takes snapshots. A recorder handles its own failures.
class SnapshotRecorder {
 public:
  virtual ~SnapshotRecorder() = default;
  // Called on the thread that takes snapshots. May wait for a lock, but not for I/O.
  virtual void recordSnapshot(Date time, const Dictionary& signature,
                              const std::filesystem::path& path) = 0;
};

}  // namespace halvox::platform::linux_
