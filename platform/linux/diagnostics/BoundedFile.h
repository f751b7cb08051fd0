#pragma once

#include <cstddef>
#include <filesystem>
#include <string>

namespace halvox::platform::linux_ {

// The result of collecting one part of a capture: bytes, or the reason why there are none.
struct Finding {
  std::string bytes{};
  bool isCut = false;     // there was more than `bytes`
  std::string failure{};  // empty if the bytes were collected

  static Finding failed(std::string why) { return {.bytes = {}, .failure = std::move(why)}; }
  [[nodiscard]] bool isCollected() const { return failure.empty(); }
};

// Reads at most the first `most` bytes of a file. Does not rely on the file's size, which is 0 for
// files in /proc. Reads only regular files and does not follow a link in the last component. Blocks
// on the disk, but never waits for another process as reading a pipe would.
[[nodiscard]] Finding readBounded(const std::filesystem::path& file, std::size_t most);

// Returns the system's text for an errno.
[[nodiscard]] std::string errorText(int error);

}  // namespace halvox::platform::linux_
