#pragma once

#include <filesystem>

#include <unistd.h>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {

// Creates a file in `directory` and removes its name at once, for file systems without O_TMPFILE.
// The kernel removes the file when its last descriptor is closed. Returns 0 and sets `file`, or
// returns the error number and leaves `file` empty.
//
// The name is normally the same, and each call first removes the file that has it. If the name
// cannot be removed, one empty file therefore remains, however often the caller tries again. If a
// directory or a file of another user has the name, the file gets a random name. Several processes
// may call at once. `removeName` is unlink(2), except in tests.
[[nodiscard]] int createUnnamedFile(const std::filesystem::path& directory, UniqueFd& file,
                                    int (*removeName)(const char*) = ::unlink);

}  // namespace halvox::platform::linux_
