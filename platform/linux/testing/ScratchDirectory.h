#pragma once

#include <filesystem>
#include <string>
#include <string_view>

namespace halvox::platform::linux_ {

// An empty directory for one test. The destructor removes it with its content. Its path is short
// enough for sockets in it. The constructor throws when it cannot make one.
class ScratchDirectory {
 public:
  ScratchDirectory();
  ScratchDirectory(const ScratchDirectory&) = delete;
  ScratchDirectory& operator=(const ScratchDirectory&) = delete;
  ~ScratchDirectory();
  [[nodiscard]] const std::filesystem::path& path() const { return path_; }
  // The path of an entry in it, as text.
  [[nodiscard]] std::string path(std::string_view name) const { return (path_ / name).string(); }

 private:
  std::filesystem::path path_;
};

}  // namespace halvox::platform::linux_
