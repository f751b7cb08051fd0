#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>
#include <string_view>

#include "platform/connection.h"
#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {

// An open directory below a root, or the error of opening it. The path is opened one name at a
// time. Symbolic links below the root are not followed, and ".." is refused. A program that may
// write below the root therefore cannot redirect the service to a place outside the root. The root
// itself may be a link.
//
// Any thread may use it. Blocks on the disk.
struct RootedDirectory {
  // A path that is absolute for callers. In the file system it is below `root`.
  struct Place {
    const std::filesystem::path& root;
    std::string_view path;
    // The path in the file system.
    [[nodiscard]] std::string text() const;
  };

  UniqueFd descriptor;
  std::optional<Error> error;  // set when there is no descriptor

  [[nodiscard]] static RootedDirectory open(const Place& place);
  // Creates the missing directories. If the last one is created, it gets exactly `permissions`,
  // regardless of the umask. Directories that exist are not changed.
  [[nodiscard]] static RootedDirectory make(const Place& place, std::uint32_t permissions);
};

}  // namespace halvox::platform::linux_
