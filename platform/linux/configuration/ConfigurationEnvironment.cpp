#include "platform/linux/configuration/ConfigurationEnvironment.h"

#include <array>
#include <cstdlib>

#include <pwd.h>
#include <unistd.h>

namespace halvox::platform::linux_ {

std::optional<std::filesystem::path> environmentPath(const char* variable) {
  const char* value = std::getenv(variable);
  if (value == nullptr) return std::nullopt;
  const std::string_view list(value);
  // systemd separates the directories of a unit by colons. The first one is ours.
  std::filesystem::path path(list.substr(0, list.find(':')));
  // The XDG rules say that relative paths must be ignored.
  if (!path.is_absolute()) return std::nullopt;
  return path;
}

std::filesystem::path homeDirectory() {
  if (auto home = environmentPath("HOME")) return *home;
  // Services of the system are often started without HOME.
  passwd entry{};
  passwd* found = nullptr;
  std::array<char, 4096> buffer;
  ::getpwuid_r(::getuid(), &entry, buffer.data(), buffer.size(), &found);
  if (found != nullptr && found->pw_dir != nullptr && *found->pw_dir == '/') return found->pw_dir;
  return "/";
}

bool isBelow(const std::filesystem::path& path, const std::filesystem::path& directory) {
  const std::filesystem::path relative = path.lexically_relative(directory);
  return !relative.empty() && *relative.begin() != ".." && relative != ".";
}

std::optional<std::filesystem::path> expandedPath(std::string_view text) {
  if (text.find('\0') != std::string_view::npos) return std::nullopt;
  if (text == "~") return homeDirectory();
  if (text.starts_with("~/")) return homeDirectory() / text.substr(2);
  if (!text.starts_with('/')) return std::nullopt;
  return std::filesystem::path(text);
}

std::filesystem::path defaultSocketPath() {
  constexpr const char* kName = "reporting.sock";
  // systemd sets this variable, and has already made the directory for the service's user.
  if (auto directory = environmentPath("RUNTIME_DIRECTORY")) return *directory / kName;
  if (auto directory = environmentPath("XDG_RUNTIME_DIR")) return *directory / "halvox" / kName;
  return std::filesystem::path("/run/halvox") / kName;
}

std::filesystem::path defaultStorageDirectory() {
  if (auto directory = environmentPath("STATE_DIRECTORY")) return *directory;
  return userStorageDirectory();
}

std::filesystem::path userStorageDirectory() {
  if (auto directory = environmentPath("XDG_STATE_HOME")) return *directory / "halvox";
  return homeDirectory() / ".local/state/halvox";
}

std::filesystem::path systemStorageDirectory() { return "/var/lib/halvox"; }

}  // namespace halvox::platform::linux_
