#pragma once

#include <filesystem>
#include <optional>
#include <string_view>

namespace halvox::platform::linux_ {

// Where files are, by the environment variables. As the XDG base directory rules require, relative
// paths are ignored. Of a list of directories, the first is used.

// The value of `variable`; none if it is not set or not an absolute path.
std::optional<std::filesystem::path> environmentPath(const char* variable);

// The user's home directory: $HOME, else the one in the user database, else "/".
std::filesystem::path homeDirectory();

// `text` as an absolute path, with "~" and "~/" expanded; none for a relative path, and for one
// with a NUL.
std::optional<std::filesystem::path> expandedPath(std::string_view text);

// Whether `path` is inside `directory`. Compares names only; does not follow links.
bool isBelow(const std::filesystem::path& path, const std::filesystem::path& directory);

// Where a service listens and stores without a setting: in the directories that its systemd unit
// gives it, otherwise in the user's.
std::filesystem::path defaultSocketPath();
std::filesystem::path defaultStorageDirectory();

// Where a user's service stores, and where the system's service does.
std::filesystem::path userStorageDirectory();
std::filesystem::path systemStorageDirectory();

}  // namespace halvox::platform::linux_
