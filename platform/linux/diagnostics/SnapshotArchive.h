#pragma once

#include <cstdint>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

namespace halvox::platform::linux_ {

// One tar archive (pax, compressed by zstd) on its way to the disk under a temporary name, mode
// 0600. Let go of before it was kept, it leaves no file behind. Belongs to one thread; everything
// waits for the disk. Failures are texts that name the file and the reason.
class SnapshotArchive {
 public:
  using Failure = std::optional<std::string>;

  // Holds at most that many bytes of content before compression.
  SnapshotArchive(std::filesystem::path temporaryPath, std::uint64_t mostBytes);
  SnapshotArchive(const SnapshotArchive&) = delete;
  SnapshotArchive& operator=(const SnapshotArchive&) = delete;
  ~SnapshotArchive();

  [[nodiscard]] Failure open();
  [[nodiscard]] std::uint64_t roomLeft() const { return room_; }
  // Adds a file. There must be room for it.
  [[nodiscard]] Failure add(const std::string& name, std::string_view bytes);
  // Ends the archive and brings it to the disk.
  [[nodiscard]] Failure finish();
  // The archive has got another name and stays.
  void keep() { isKept_ = true; }

  [[nodiscard]] const std::filesystem::path& temporaryPath() const { return path_; }
  // Of the file on the disk, once it is finished.
  [[nodiscard]] std::uint64_t size() const { return size_; }

 private:
  struct Writer;

  // Why bytes did not reach the disk; none when they did.
  [[nodiscard]] Failure writeFailure() const;
  // Why the library did not take what it was given.
  [[nodiscard]] Failure failed() const;

  const std::filesystem::path path_;
  const std::unique_ptr<Writer> writer_;
  std::uint64_t room_;
  std::uint64_t size_ = 0;
  bool isCreated_ = false;
  bool isKept_ = false;
};

}  // namespace halvox::platform::linux_
