#pragma once

#include <cstddef>
#include <filesystem>
#include <string>

namespace halvox::platform::linux_ {

// What was found out about one thing: bytes, or why there are none.
struct Finding {
  std::string bytes{};
  bool isCut = false;     // the bytes are the start of more
  std::string failure{};  // empty: the bytes were collected

  static Finding failed(std::string why) { return {.bytes = {}, .failure = std::move(why)}; }
  [[nodiscard]] bool isCollected() const { return failure.empty(); }
};

// The first bytes of a file, such as one of the kernel's that has no size. Does not follow a link
// at the path's end, reads regular files only, and never waits for another process.
[[nodiscard]] Finding readBounded(const std::filesystem::path& file, std::size_t most);

// The text of an errno.
[[nodiscard]] std::string errorText(int error);

}  // namespace halvox::platform::linux_
