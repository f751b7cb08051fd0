#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>
#include <string_view>

#include "platform/connection.h"
#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {

// An open directory below a root. The path is opened one name at a time, without following a
// symbolic link below the root, and ".." is refused. A program that may write below the root
// therefore cannot redirect the service to a place outside it. The root itself may be a link.
//
// Any thread may use it. Blocks on the disk.
struct RootedDirectory {
  // A path that callers see as absolute, and that lies below `root` in the file system.
  struct Place {
    const std::filesystem::path& root;
    std::string_view path;
    // The path in the file system.
    [[nodiscard]] std::string text() const;
  };

  UniqueFd descriptor;
  std::optional<Error> error;  // set when there is no descriptor

  [[nodiscard]] static RootedDirectory open(const Place& place);
  // Creates the directories that are missing. The last one gets exactly `permissions`, regardless
  // of the umask. Directories that exist are not changed.
  [[nodiscard]] static RootedDirectory make(const Place& place, std::uint32_t permissions);
};

}  // namespace halvox::platform::linux_
