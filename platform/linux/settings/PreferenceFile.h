#pragma once

#include <cstddef>
#include <filesystem>
#include <optional>
#include <string>
#include <string_view>
#include <variant>

#include "platform/value.h"

namespace halvox::platform::linux_ {

// Files of preferences: one TOML file per user and domain.

// Whose files count: named suites and the watched settings are this user's.
inline constexpr std::string_view kPreferenceUser = "mobile";
// Larger files are not read: reading must not hold anybody up.
inline constexpr std::size_t kLargestPreferenceFile = 1U << 20U;

// Why a file cannot be read or changed: one line for the user, which begins with the file and, for
// a mistake in it, "FILE:LINE:COLUMN: ".
struct PreferenceFileError {
  std::string description;
};

// What a file holds and which state of which file that was.
struct PreferenceText {
  std::string text;
  unsigned mode = 0;  // permission bits
};

// The file of that domain of that user; none when one of the names may not become a file's.
std::optional<std::filesystem::path> preferencePath(const std::filesystem::path& directory,
                                                    std::string_view user, std::string_view domain);

// The text of a file; none when there is no such file. Reads regular files of limited size and
// nesting only and never waits for a writer.
std::variant<std::optional<PreferenceText>, PreferenceFileError> readPreferenceText(
    const std::filesystem::path& file);

// The values that a text means. `file` is for the message.
std::variant<Dictionary, PreferenceFileError> parsePreferences(std::string_view text,
                                                               const std::filesystem::path& file);

// Both of it: the values of a file, empty when there is no such file.
std::variant<Dictionary, PreferenceFileError> readPreferences(const std::filesystem::path& file);

}  // namespace halvox::platform::linux_
