#pragma once

#include <filesystem>

#include <unistd.h>

#include "platform/linux/base/UniqueHandle.h"

namespace halvox::platform::linux_ {

// Creates a file in `directory` and removes its name at once. The kernel removes the file with its
// last descriptor. For file systems without O_TMPFILE. Returns 0 and sets `file`, or returns the
// error number and leaves `file` empty.
//
// The name is always the same. If it cannot be removed, one empty file remains, however often the
// caller tries again: the next call must remove it first. Several processes may call at once.
// `removeName` is unlink(2), except in tests.
[[nodiscard]] int createUnnamedFile(const std::filesystem::path& directory, UniqueFd& file,
                                    int (*removeName)(const char*) = ::unlink);

}  // namespace halvox::platform::linux_
