#pragma once

#include "platform/linux/diagnostics/SnapshotRecorder.h"
#include "platform/linux/store/SqliteStore.h"

namespace halvox::platform::linux_ {

// Records snapshots in the store. Does not own the store, which must outlive it. Any thread.
class SqliteSnapshotRecorder final : public SnapshotRecorder {
 public:
  explicit SqliteSnapshotRecorder(SqliteStore& store) : records_(store.snapshots()) {}

  void recordSnapshot(Date time, const Dictionary& signature,
                      const std::filesystem::path& path) override {
    records_.add({.time = time.secondsSince1970, .signature = signature, .path = path.native()});
  }

 private:
  SnapshotRecords& records_;
};

}  // namespace halvox::platform::linux_
