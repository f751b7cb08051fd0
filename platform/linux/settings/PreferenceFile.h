#pragma once

#include <cstddef>
#include <filesystem>
#include <optional>
#include <string>
#include <string_view>

#include "platform/linux/base/Result.h"
#include "platform/value.h"

namespace halvox::platform::linux_ {

// Preference files: one TOML file for each user and domain. These functions block on the disk, and
// any thread may call them. The message of a failure is one line for the user. It begins with the
// file name, or with "FILE:LINE:COLUMN: " for a mistake in the file.

// The user whose files hold the named suites and the watched settings.
inline constexpr std::string_view kPreferenceUser = "mobile";
// Larger files are refused, because callers on the service's queues wait while the file is read.
inline constexpr std::size_t kLargestPreferenceFile = 1U << 20U;

// The content and the permissions of a file.
struct PreferenceText {
  std::string text;
  unsigned mode = 0;  // permission bits
};

// Returns the path of a domain's file; std::nullopt when a name is not usable in a path.
std::optional<std::filesystem::path> preferencePath(const std::filesystem::path& directory,
                                                    std::string_view user, std::string_view domain);

// Returns the text of a file; std::nullopt when there is no such file. Accepts only regular files
// within the limits of size and nesting, and never waits for another process.
Result<std::optional<PreferenceText>> readPreferenceText(const std::filesystem::path& file);

// Returns the values in a text. `file` is only for the error message.
Result<Dictionary> parsePreferences(std::string_view text, const std::filesystem::path& file);

// Returns the values in a file; empty when there is no such file.
Result<Dictionary> readPreferences(const std::filesystem::path& file);

}  // namespace halvox::platform::linux_
