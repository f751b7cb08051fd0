#pragma once

#include <filesystem>
#include <optional>
#include <string_view>

namespace halvox::platform::linux_ {

// What the environment says about where files are. Relative paths in it are ignored, as the base
// directory rules want; of a list of directories the first counts.

// The value of that variable when it is an absolute path.
std::optional<std::filesystem::path> environmentPath(const char* variable);

// The user's home directory: $HOME, else that of the user database, else the root directory.
std::filesystem::path homeDirectory();

// The absolute path that `text` gives, "~" and "~/" expanded; none for a relative path or one that
// holds a NUL.
std::optional<std::filesystem::path> expandedPath(std::string_view text);

// Whether `path` names something within `directory`, by their names alone.
bool isBelow(const std::filesystem::path& path, const std::filesystem::path& directory);

// Where a service listens and stores of whom nothing else was said.
std::filesystem::path defaultSocketPath();
std::filesystem::path defaultStorageDirectory();

// Where a user's service stores, and that of the system.
std::filesystem::path userStorageDirectory();
std::filesystem::path systemStorageDirectory();

}  // namespace halvox::platform::linux_
