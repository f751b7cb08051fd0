#pragma once

#include <cstdint>
#include <filesystem>
#include <memory>
#include <string>
#include <string_view>

#include "platform/linux/base/Result.h"

namespace halvox::platform::linux_ {

// Writes one tar archive (pax format, zstd compression, mode 0600) under a temporary name. The
// destructor deletes the file unless keep() was called. Belongs to one thread and one owner. All
// functions but the getters block on the disk. After a failure, the object can only be destroyed.
//
//   open(); add() for each file; finish(); rename the file; keep()
class SnapshotArchive {
 public:
  // `mostBytes` limits the size of the content before compression.
  SnapshotArchive(std::filesystem::path temporaryPath, std::uint64_t mostBytes);
  SnapshotArchive(const SnapshotArchive&) = delete;
  SnapshotArchive& operator=(const SnapshotArchive&) = delete;
  ~SnapshotArchive();

  Result<void> open();
  [[nodiscard]] std::uint64_t roomLeft() const { return room_; }
  // Adds a file. The caller must have checked roomLeft().
  Result<void> add(const std::string& name, std::string_view bytes);
  // Completes the archive and syncs it to the disk.
  Result<void> finish();
  // Keeps the file. Call it after the file was renamed.
  void keep() { isKept_ = true; }

  [[nodiscard]] const std::filesystem::path& temporaryPath() const { return path_; }
  // The size of the file in bytes, after finish().
  [[nodiscard]] std::uint64_t size() const { return size_; }

 private:
  struct Writer;

  // Fails if a write to the file has failed.
  [[nodiscard]] Result<void> written() const;
  // Returns why a call of libarchive failed.
  [[nodiscard]] Failure<> failed() const;

  const std::filesystem::path path_;
  const std::unique_ptr<Writer> writer_;
  std::uint64_t room_;
  std::uint64_t size_ = 0;
  bool isCreated_ = false;
  bool isKept_ = false;
};

}  // namespace halvox::platform::linux_
