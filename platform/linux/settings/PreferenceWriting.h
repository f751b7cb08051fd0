#pragma once

#include <chrono>
#include <filesystem>
#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <variant>

#include "platform/linux/settings/PreferenceFile.h"

namespace halvox::platform::linux_ {

// What becomes of a file's text.
using PreferenceEdit = std::function<std::variant<std::string, PreferenceFileError>(
    std::string_view text, const std::filesystem::path& file)>;

// Changes a preference file as a whole or not at all: what is written is on the disk before it
// takes the old file's place, with the same permissions. Makes the file and its directories when
// they are missing. Others who change files of that directory in the same way wait, for so long at
// most, so that no change is lost. A file that would stay as it is is not written. Gives what went
// wrong.
std::optional<PreferenceFileError> changePreferenceFile(
    const std::filesystem::path& named, const PreferenceEdit& edit,
    std::chrono::milliseconds patience = std::chrono::seconds(5));

}  // namespace halvox::platform::linux_
