#pragma once

#include <cstddef>
#include <cstdint>
#include <string>

#include <sys/stat.h>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {

// The content of a small file, or why there is none.
struct SmallFile {
  enum class Outcome : std::uint8_t { kRead, kMissing, kNotRegular, kTooLarge, kFailed };
  Outcome outcome = Outcome::kFailed;
  int error = 0;  // errno of kMissing and kFailed
  std::string text{};
};

// Reads a regular file of at most `most` bytes, `name` below the directory. Never waits for another
// process: pipes, devices and directories are not even opened. Files of the kernel, whose size is
// 0, are read too. Any thread may call.
[[nodiscard]] SmallFile readSmallFile(int directory, const char* name, std::size_t most);

// A directory to read files below; empty if it cannot be opened.
[[nodiscard]] UniqueFd openDirectory(const char* path);
[[nodiscard]] UniqueFd openDirectoryAt(int directory, const char* name);

}  // namespace halvox::platform::linux_
