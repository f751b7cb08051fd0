#pragma once

#include <filesystem>
#include <optional>
#include <string_view>

namespace halvox::platform::linux_ {

// Finds places of files in environment variables. Ignores relative paths, as the XDG base directory
// rules require. Uses the first directory of a list.

// Returns the value of `variable`; std::nullopt if it is not set or not an absolute path.
std::optional<std::filesystem::path> environmentPath(const char* variable);

// The user's home directory: $HOME, else the one in the user database, else "/".
std::filesystem::path homeDirectory();

// Returns `text` as an absolute path, with "~" and "~/" expanded; std::nullopt for a relative path,
// and for one with a NUL.
std::optional<std::filesystem::path> expandedPath(std::string_view text);

// Returns whether `path` is inside `directory`. Compares only names; does not follow links.
bool isBelow(const std::filesystem::path& path, const std::filesystem::path& directory);

// The default places of a service's socket and storage: in the directories that its systemd unit
// sets, otherwise in the user's.
std::filesystem::path defaultSocketPath();
std::filesystem::path defaultStorageDirectory();

// The storage directories of a user's service and of the system's service.
std::filesystem::path userStorageDirectory();
std::filesystem::path systemStorageDirectory();

}  // namespace halvox::platform::linux_
