#pragma once

#include <filesystem>
#include <string>
#include <string_view>
#include <variant>

#include "platform/linux/settings/PreferenceFile.h"
#include "platform/value.h"

namespace halvox::platform::linux_ {

// Changes of single preferences in the text of a file. Everything else in the text (comments,
// order, spacing) stays as it is. A change that would need more than the lines of that key is
// refused, and every result is read again before it is given: it means what was asked for, or
// nothing is given.

// A value as it stands in a file, and what it means.
struct PreferenceValue {
  std::string text;
  Value value;
};

enum class ValueForm : unsigned char { kTomlOrString, kString };

// What a user wrote as a value: any TOML value (7, true, "text", [1, 2], 2026-03-01), and what is
// none is a string. With kString it is always one. An error when it is not UTF-8.
std::variant<PreferenceValue, PreferenceFileError> parsePreferenceValue(std::string_view text,
                                                                        ValueForm form);

// The text with a key of the first level set to a value, in its place or as a new line behind the
// other keys of the first level. `file` is for messages.
std::variant<std::string, PreferenceFileError> withPreference(std::string_view text,
                                                              std::string_view key,
                                                              const PreferenceValue& value,
                                                              const std::filesystem::path& file);
// The text without a key of the first level and its lines; the same text when it has no such key.
std::variant<std::string, PreferenceFileError> withoutPreference(std::string_view text,
                                                                 std::string_view key,
                                                                 const std::filesystem::path& file);

}  // namespace halvox::platform::linux_
