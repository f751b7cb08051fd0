#pragma once

#include <filesystem>
#include <string>
#include <string_view>

#include "platform/linux/base/Result.h"
#include "platform/linux/settings/PreferenceFile.h"
#include "platform/value.h"

namespace halvox::tools {

// Changes single preferences in the text of a file and keeps everything else as it is: comments,
// order and spacing. People edit these files too.
//
// Refuses a change that would need more than the lines of its key. Parses every result again and
// returns it only if it has the intended values, because a text edit can go wrong in ways that a
// parser cannot. Pure functions: any thread may call.

// A value as TOML text, and its meaning.
struct PreferenceValue {
  std::string text;
  platform::Value value;
};

// Whether a text that looks like TOML is taken as TOML.
enum class ValueForm : unsigned char { kTomlOrString, kString };

// Interprets what a user wrote as a value. Text that is one TOML value (7, true, "text", [1, 2],
// 2026-03-01) is that value; any other text, or every text with kString, is a string. Returns an
// error if the text is not UTF-8.
platform::linux_::Result<PreferenceValue> parsePreferenceValue(std::string_view text,
                                                               ValueForm form);

// Returns the text with a top-level key set to a value. Changes the key where it stands, or adds a
// line after the other top-level keys. `file` is only for error messages.
platform::linux_::Result<std::string> withPreference(std::string_view text, std::string_view key,
                                                     const PreferenceValue& value,
                                                     const std::filesystem::path& file);
// Returns the text without a top-level key and its lines. Returns the same text if it has no such
// key.
platform::linux_::Result<std::string> withoutPreference(std::string_view text, std::string_view key,
                                                        const std::filesystem::path& file);

}  // namespace halvox::tools
