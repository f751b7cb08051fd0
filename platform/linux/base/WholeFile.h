#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

#include <fcntl.h>
#include <sys/types.h>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {

// Which file to read, and how.
struct FileToRead {
  // Use kRegular unless the text may come through a pipe. Opening a device may have an effect, and
  // reading a pipe waits for its writer.
  enum class Kinds : std::uint8_t { kRegular, kAny };
  // Whether a symbolic link in the last component of the path is followed.
  enum class Links : std::uint8_t { kFollowed, kRefused };
  // What happens if the file has more than `most` bytes.
  enum class Excess : std::uint8_t { kRefused, kCut };

  const char* path;          // the caller owns the text
  std::size_t most;          // bytes
  int directory = AT_FDCWD;  // where a relative path starts
  Kinds kinds = Kinds::kRegular;
  Links links = Links::kFollowed;
  Excess excess = Excess::kRefused;
};

// What was read, or why nothing could be read.
struct FileContent {
  enum class Outcome : std::uint8_t {
    kRead,        // `bytes` is the whole file
    kMissing,     // the file or a directory of its path does not exist
    kNotRegular,  // a directory, pipe, socket or device; `mode` says which
    kTooLarge,    // more than `most` bytes; `bytes` has the first `most` with Excess::kCut
    kFailed,      // `bytes` has what was read before the error
  };

  Outcome outcome = Outcome::kFailed;
  int error = 0;  // errno of kMissing and kFailed
  std::string bytes{};
  // As the file system reports them; 0 if it has not reported them, for example for a missing file.
  std::uint64_t size = 0;  // 0 for the files of /proc
  mode_t mode = 0;         // type and permissions

  [[nodiscard]] bool isRead() const { return outcome == Outcome::kRead; }
  [[nodiscard]] bool isMissing() const { return outcome == Outcome::kMissing; }
};

// Reads a small file in one piece. Blocks on the disk. With Kinds::kRegular it never waits for
// another process. With Kinds::kAny it reads a pipe until the writer closes it; a pipe without a
// writer gives an empty text. Does not rely on the file's size, which is 0 for files of /proc and
// may change during the reading. Any thread may call it.
[[nodiscard]] FileContent readWholeFile(const FileToRead& file);

// Opens a directory for reading files below it. Returns an empty handle, with errno set, if it
// cannot be opened. A relative path starts at `below`.
[[nodiscard]] UniqueFd openDirectory(const char* path, int below = AT_FDCWD);

}  // namespace halvox::platform::linux_
