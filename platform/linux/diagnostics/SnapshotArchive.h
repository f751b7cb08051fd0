#pragma once

#include <cstdint>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

namespace halvox::platform::linux_ {

// Writes one tar archive (pax format, zstd compression, mode 0600) under a temporary name. The
// destructor deletes the file unless keep() was called. Belongs to one thread and one owner. All
// functions but the getters block on the disk. A Failure is a text that names the file and the
// reason; after one, only destruction makes sense.
//
//   open(); add() for each file; finish(); rename the file; keep()
class SnapshotArchive {
 public:
  using Failure = std::optional<std::string>;

  // `mostBytes` bounds the content before compression.
  SnapshotArchive(std::filesystem::path temporaryPath, std::uint64_t mostBytes);
  SnapshotArchive(const SnapshotArchive&) = delete;
  SnapshotArchive& operator=(const SnapshotArchive&) = delete;
  ~SnapshotArchive();

  [[nodiscard]] Failure open();
  [[nodiscard]] std::uint64_t roomLeft() const { return room_; }
  // Adds a file. The caller must have checked roomLeft().
  [[nodiscard]] Failure add(const std::string& name, std::string_view bytes);
  // Completes the archive and syncs it to the disk.
  [[nodiscard]] Failure finish();
  // Keeps the file. Call it after the file was renamed.
  void keep() { isKept_ = true; }

  [[nodiscard]] const std::filesystem::path& temporaryPath() const { return path_; }
  // The size of the file in bytes, after finish().
  [[nodiscard]] std::uint64_t size() const { return size_; }

 private:
  struct Writer;

  // Returns why a write to the file failed, or std::nullopt if all succeeded.
  [[nodiscard]] Failure writeFailure() const;
  // Returns why a call of libarchive failed.
  [[nodiscard]] Failure failed() const;

  const std::filesystem::path path_;
  const std::unique_ptr<Writer> writer_;
  std::uint64_t room_;
  std::uint64_t size_ = 0;
  bool isCreated_ = false;
  bool isKept_ = false;
};

}  // namespace halvox::platform::linux_
