#include "platform/linux/base/WholeFile.h"

#include <algorithm>
#include <array>
#include <cerrno>
#include <utility>

#include <sys/stat.h>
#include <unistd.h>

namespace halvox::platform::linux_ {
namespace {

using Outcome = FileContent::Outcome;

constexpr std::size_t kPieceSize = 16'384;

void fail(FileContent& content, int error) {
  const bool isMissing = error == ENOENT || error == ENOTDIR;
  content.outcome = isMissing ? Outcome::kMissing : Outcome::kFailed;
  content.error = error;
}

// Stores the size and mode of the file. Returns false if the file must not be read.
bool accept(const FileToRead& file, const struct stat& status, FileContent& content) {
  content.size = static_cast<std::uint64_t>(status.st_size);
  content.mode = status.st_mode;
  if (file.kinds == FileToRead::Kinds::kAny) return true;
  if (!S_ISREG(status.st_mode)) {
    content.outcome = Outcome::kNotRegular;
    return false;
  }
  const bool isRefused = file.excess == FileToRead::Excess::kRefused && content.size > file.most;
  if (isRefused) content.outcome = Outcome::kTooLarge;
  return !isRefused;
}

// Checks the file before it is opened. Returns false if it must not be opened.
bool isToBeOpened(const FileToRead& file, FileContent& content) {
  if (file.kinds == FileToRead::Kinds::kAny) return true;
  const bool refusesLinks = file.links == FileToRead::Links::kRefused;
  struct stat status {};
  if (::fstatat(file.directory, file.path, &status, refusesLinks ? AT_SYMLINK_NOFOLLOW : 0) != 0) {
    fail(content, errno);
    return false;
  }
  if (S_ISLNK(status.st_mode)) {
    fail(content, ELOOP);  // the error of open() with O_NOFOLLOW
    return false;
  }
  return accept(file, status, content);
}

void readAll(int descriptor, const FileToRead& file, FileContent& content) {
  // Only a hint, because files of /proc have the size 0, and a file may grow while it is read.
  content.bytes.reserve(std::min<std::uint64_t>(content.size, file.most));
  std::array<char, kPieceSize> piece;
  while (true) {
    // Read one byte more than wanted to find out whether the file is longer.
    const std::size_t room = std::min(piece.size(), file.most - content.bytes.size() + 1);
    const ssize_t count = ::read(descriptor, piece.data(), room);
    if (count < 0 && errno == EINTR) continue;
    if (count < 0) return fail(content, errno);
    if (count == 0) break;
    content.bytes.append(piece.data(), static_cast<std::size_t>(count));
    if (content.bytes.size() > file.most) {
      content.bytes.resize(file.excess == FileToRead::Excess::kCut ? file.most : 0);
      content.outcome = Outcome::kTooLarge;
      return;
    }
  }
  content.outcome = Outcome::kRead;
}

}  // namespace

FileContent readWholeFile(const FileToRead& file) {
  FileContent content;
  if (!isToBeOpened(file, content)) return content;
  // O_NONBLOCK is needed because another process may have put a pipe in the file's place, and
  // opening a pipe without a writer would block.
  const int links = file.links == FileToRead::Links::kRefused ? O_NOFOLLOW : 0;
  const UniqueFd descriptor(
      ::openat(file.directory, file.path, O_RDONLY | O_CLOEXEC | O_NONBLOCK | O_NOCTTY | links));
  if (!descriptor) {
    fail(content, errno);
    return content;
  }
  // Check again, because another file may have taken the name since the first check.
  struct stat status {};
  if (::fstat(descriptor.get(), &status) != 0) {
    fail(content, errno);
    return content;
  }
  if (!accept(file, status, content)) return content;
  // The caller allows pipes. Reads must block until the writer has sent something.
  if (file.kinds == FileToRead::Kinds::kAny) ::fcntl(descriptor.get(), F_SETFL, 0);
  readAll(descriptor.get(), file, content);
  return content;
}

UniqueFd openDirectory(const char* path, int below) {
  return UniqueFd(::openat(below, path, O_RDONLY | O_CLOEXEC | O_DIRECTORY));
}

}  // namespace halvox::platform::linux_
