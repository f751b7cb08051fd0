#pragma once

#include <chrono>
#include <filesystem>
#include <functional>
#include <string>
#include <string_view>

#include "platform/linux/base/Result.h"
#include "platform/linux/settings/PreferenceFile.h"

namespace halvox::tools {

// Returns the new text of a file, or an error that leaves the file as it is.
using PreferenceEdit = std::function<platform::linux_::Result<std::string>(
    std::string_view text, const std::filesystem::path& file)>;

// Changes a preference file completely or not at all: the new text is on the disk before it
// replaces the old file, whose permissions it keeps. If the file is a symbolic link, the link stays
// and its target changes. Creates a missing file and its directories. Does not write a file whose
// text stays the same.
//
// Holds a lock on the directory meanwhile, so that two programs that change files in this way do
// not lose a change. Waits for that lock at most `patience`, because anyone who may read the
// directory can hold it. Blocks on the disk.
platform::linux_::Result<void> changePreferenceFile(
    const std::filesystem::path& named, const PreferenceEdit& edit,
    std::chrono::milliseconds patience = std::chrono::seconds(5));

}  // namespace halvox::tools
