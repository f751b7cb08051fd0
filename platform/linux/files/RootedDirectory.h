#pragma once

#include <cstdint>
#include <filesystem>
#include <optional>
#include <string>
#include <string_view>

#include "platform/connection.h"
#include "platform/linux/UniqueHandle.h"

namespace halvox::platform::linux_ {

// A directory below a root, opened step by step so that no symbolic link below the root is ever
// followed: nothing can lead out of it, whoever may write there.
struct RootedDirectory {
  // What is in the root of the file system for the callers of this.
  struct Place {
    const std::filesystem::path& root;
    std::string_view path;
    // As it is in the file system.
    [[nodiscard]] std::string text() const;
  };

  UniqueFd descriptor;
  std::optional<Error> error;  // why there is no descriptor

  [[nodiscard]] static RootedDirectory open(const Place& place);
  // Makes what is missing: the root and the parents as usual, the last one with exactly these
  // permissions, whatever the process masks. What exists stays as it is.
  [[nodiscard]] static RootedDirectory make(const Place& place, std::uint32_t permissions);
};

}  // namespace halvox::platform::linux_
