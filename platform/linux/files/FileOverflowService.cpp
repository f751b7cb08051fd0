#include "platform/linux/files/FileOverflowService.h"

#include <cerrno>
#include <string>
#include <system_error>
#include <utility>

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/linux/files/FileError.h"
#include "platform/linux/files/UnnamedFile.h"

namespace halvox::platform::linux_ {
namespace {

constexpr mode_t kPermissions = 0600;  // private, because the file has what clients reported
constexpr std::uint64_t kMegabyte = 1024 * 1024;
constexpr std::uint64_t kSharesOfMemory = 4;
// Only whole blocks can be punched out of a file. Each piece therefore begins at a multiple of this
// size, and no two pieces share a block.
constexpr std::uint64_t kBlock = 4096;

std::uint64_t blocksOf(std::size_t length) { return (length + kBlock - 1) / kBlock * kBlock; }

int writeAll(int file, std::span<const std::byte> bytes, std::uint64_t offset) {
  while (!bytes.empty()) {
    const ssize_t count = ::pwrite(file, bytes.data(), bytes.size(), static_cast<off_t>(offset));
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return errno;
    bytes = bytes.subspan(static_cast<std::size_t>(count));
    offset += static_cast<std::uint64_t>(count);
  }
  return 0;
}

int readAll(int file, std::span<std::byte> bytes, std::uint64_t offset) {
  while (!bytes.empty()) {
    const ssize_t count = ::pread(file, bytes.data(), bytes.size(), static_cast<off_t>(offset));
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return errno;
    if (count == 0) return EIO;  // the file is shorter than what was written to it
    bytes = bytes.subspan(static_cast<std::size_t>(count));
    offset += static_cast<std::uint64_t>(count);
  }
  return 0;
}

}  // namespace

FileOverflowService::FileOverflowService(OverflowOptions options, StatisticsService& statistics)
    : options_(std::move(options)),
      counters_{statistics.counter("overflow", "bytes written"),
                statistics.counter("overflow", "bytes released"),
                statistics.counter("overflow", "failed")} {}

std::size_t FileOverflowService::memoryPerClient() const {
  return options_.clientMegabytes * kMegabyte / kSharesOfMemory;
}

std::optional<Error> FileOverflowService::write(std::span<const std::byte> bytes,
                                                OverflowPlace& place) {
  OverflowPlace reserved{.offset = 0, .length = bytes.size()};
  int file = -1;
  {
    const MutexLock lock(mutex_);
    if (!file_) {
      if (const int error = createFile()) return fail("create a file in", error);
    }
    file = file_.get();
    reserved.offset = end_;
    end_ += blocksOf(bytes.size());
    used_ += bytes.size();
  }
  if (const int error = writeAll(file, bytes, reserved.offset)) {
    const MutexLock lock(mutex_);
    giveBack(reserved);
    return fail("write to a file in", error);
  }
  counters_.written.add(bytes.size());
  place = reserved;
  return std::nullopt;
}

int FileOverflowService::createFile() {
  std::error_code error;
  std::filesystem::create_directories(options_.directory, error);
  if (error) return error.value();
  file_.reset(::open(options_.directory.c_str(), O_TMPFILE | O_RDWR | O_CLOEXEC, kPermissions));
  if (file_) return 0;
  const bool isUnknown = errno == EOPNOTSUPP || errno == EISDIR || errno == EINVAL;
  return isUnknown ? createUnnamedFile(options_.directory, file_) : errno;
}

std::optional<Error> FileOverflowService::read(OverflowPlace place, std::span<std::byte> bytes) {
  int file = -1;
  {
    const MutexLock lock(mutex_);
    file = file_.get();
  }
  if (const int error = readAll(file, bytes, place.offset)) return fail("read a file in", error);
  return std::nullopt;
}

void FileOverflowService::release(OverflowPlace place) {
  const MutexLock lock(mutex_);
  giveBack(place);
  counters_.released.add(place.length);
}

// Frees the disk space of a piece. If the file system cannot punch holes, the space stays in use
// until the last piece is released.
void FileOverflowService::giveBack(OverflowPlace place) {
  used_ -= place.length;
  if (used_ == 0) {
    // No thread is writing now, because a writer adds its bytes to used_ before it begins.
    end_ = ::ftruncate(file_.get(), 0) == 0 ? 0 : end_;
    return;
  }
  // If this was the last piece, move the end of the file back. While the disk is full, each message
  // tries to write, and the end must not advance with each attempt.
  if (end_ == place.offset + blocksOf(place.length)) end_ = place.offset;
  ::fallocate(file_.get(), FALLOC_FL_PUNCH_HOLE | FALLOC_FL_KEEP_SIZE,
              static_cast<off_t>(place.offset), static_cast<off_t>(blocksOf(place.length)));
}

std::optional<Error> FileOverflowService::fail(const char* what, int systemError) {
  counters_.failed.add();
  return fileError(what, options_.directory.string(), systemError);
}

}  // namespace halvox::platform::linux_
