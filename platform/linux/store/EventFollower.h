#pragma once

#include <filesystem>
#include <optional>

#include "platform/linux/UniqueHandle.h"
#include "platform/linux/store/StoreError.h"
#include "platform/linux/store/StoreReader.h"

namespace halvox::platform::linux_ {

// Delivers the records of one kind of a store as they come, for as long as its owner likes:
// survives that the service ends, starts again or begins a new database. Belongs to one thread;
// sleeps without a timer while nothing is written.
//
//   open(); deliver(); then, each time that descriptor() is readable: deliver()
class EventFollower {
 public:
  // Begins to watch. The first delivery has what the filter lets through of what is stored already.
  [[nodiscard]] std::optional<StoreError> open(const std::filesystem::path& directory,
                                               const RecordFilter& filter);
  // Readable (poll) when deliver() should be called. Owned by this object.
  [[nodiscard]] int descriptor() const { return poller_.get(); }
  // Calls back for each event stored since the last delivery. Does not wait for any. An error ends
  // the following: the directory is gone, or the database cannot be read.
  [[nodiscard]] std::optional<StoreError> deliver(const StoreReader::EventCallback& callback);
  // The same for the records of another kind. One follower follows one kind.
  [[nodiscard]] std::optional<StoreError> deliver(const RecordTable& table,
                                                  const StoreReader::RecordCallback& callback);

 private:
  enum class Change : unsigned char { kNone, kStoreWritten, kDirectoryGone };

  // Reads what is new, after the last that was delivered, when there may be any.
  template <typename Read>
  [[nodiscard]] std::optional<StoreError> deliverBy(Read read);
  [[nodiscard]] Change readChanges();
  [[nodiscard]] bool readTimer();
  void startTimer();
  [[nodiscard]] std::optional<StoreError> reopen(bool& isOpen);

  std::filesystem::path directory_;
  RecordFilter filter_;
  StoreReader reader_;
  UniqueFd watch_;
  UniqueFd timer_;
  UniqueFd poller_;
  bool started_ = false;
  int looksLeft_ = 0;
};

}  // namespace halvox::platform::linux_
