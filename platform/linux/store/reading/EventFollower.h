#pragma once

#include <cstddef>
#include <filesystem>

#include "platform/linux/base/Result.h"
#include "platform/linux/base/UniqueHandle.h"
#include "platform/linux/store/StoreError.h"
#include "platform/linux/store/reading/StoreReader.h"

namespace halvox::platform::linux_ {

// Follows a store. Delivers each record of one kind once, soon after the service has stored it.
// Continues to follow when the service ends, starts again or creates a new database. Belongs to one
// thread and one owner. Sets a timer only after the store was written to. A quiet store therefore
// causes no wake-ups.
//
//   open(); deliver(); then call deliver() each time that descriptor() is readable
class EventFollower {
 public:
  // Starts to watch the store in `directory`. The first deliver() delivers the records that are
  // stored already and pass the filter. Fails like StoreReader::open(), or with kCannotOpen or
  // kMissing if the directory cannot be watched.
  Result<void, StoreError> open(const std::filesystem::path& directory, const RecordFilter& filter);
  // Between open() and the first deliver(): the reader of the opened store, and another filter for
  // the deliveries. A caller can look into the store first to decide where to begin; what is stored
  // meanwhile is delivered.
  [[nodiscard]] StoreReader& reader() { return reader_; }
  void beginWith(const RecordFilter& filter) { filter_ = filter; }
  // Becomes readable (poll) when deliver() should be called. Owned by this object.
  [[nodiscard]] int descriptor() const { return poller_.get(); }
  // Calls `callback` on this thread for each event that was stored since the last delivery. Does
  // not wait for events. Returns an error if the directory was removed or the database cannot be
  // read. Following then ends.
  Result<void, StoreError> deliver(const StoreReader::EventCallback& callback);
  // Returns true if the store removed records before the last delivery reached them.
  [[nodiscard]] bool hasGap() const { return hasGap_; }
  // Delivers the records of another kind in the same way. Do not mix kinds in one follower, because
  // it remembers only one position.
  Result<void, StoreError> deliver(const RecordTable& table,
                                   const StoreReader::RecordCallback& callback);

 private:
  enum class Change : unsigned char { kNone, kStoreWritten, kDirectoryGone };

  // Calls `read` when there may be new records.
  template <typename Read>
  Result<void, StoreError> deliverBy(Read read);
  [[nodiscard]] Change readChanges();
  [[nodiscard]] bool readTimer();
  void startTimer();
  Result<bool, StoreError> reopen();

  std::filesystem::path directory_;
  RecordFilter filter_;
  StoreReader reader_;
  UniqueFd watch_;
  UniqueFd timer_;
  UniqueFd poller_;
  bool started_ = false;
  bool hasGap_ = false;
  std::size_t looksLeft_ = 0;
};

}  // namespace halvox::platform::linux_
