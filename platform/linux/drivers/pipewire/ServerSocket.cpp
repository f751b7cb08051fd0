#include "platform/linux/drivers/pipewire/ServerSocket.h"

#include <algorithm>
#include <cstdlib>
#include <string>
#include <system_error>

namespace halvox::platform::linux_ {
namespace {

constexpr const char* kDefaultName = "pipewire-0";
// The place of a machine-wide server, where the library looks if the user has none.
constexpr const char* kSystemDirectory = "/run/pipewire";

std::string remoteName() {
  const char* name = std::getenv("PIPEWIRE_REMOTE");
  return name == nullptr || *name == '\0' ? kDefaultName : name;
}

std::vector<std::string> runtimeDirectories() {
  for (const char* variable : {"PIPEWIRE_RUNTIME_DIR", "XDG_RUNTIME_DIR", "USERPROFILE"}) {
    if (const char* directory = std::getenv(variable)) return {directory, kSystemDirectory};
  }
  return {kSystemDirectory};
}

}  // namespace

std::vector<std::filesystem::path> serverSocketPaths() {
  const std::filesystem::path remote = remoteName();
  std::vector<std::filesystem::path> paths;
  for (const std::string& directory : runtimeDirectories()) {
    // A remote that is an absolute path replaces the directory.
    paths.push_back(std::filesystem::path(directory) / remote);
  }
  return paths;
}

bool hasServerSocket() {
  return std::ranges::any_of(serverSocketPaths(), [](const std::filesystem::path& path) {
    std::error_code ignored;
    return std::filesystem::exists(path, ignored);
  });
}

}  // namespace halvox::platform::linux_
