#pragma once

#include <filesystem>
#include <string_view>

#include "platform/linux/diagnostics/WaitableFlag.h"
#include "platform/value.h"

namespace halvox::platform::linux_ {

// What the kernel tells of the processes of that command name (of which it keeps 15 bytes), as far
// as we may read it: status, command line, limits, control group, a summary of the mappings, the
// number of open files, the threads. Never the environment, nor what is in any file or in memory.
// What could not be read is named with the reason.
//
// {"name": …, "found": how many, "processes": [{"pid": …, "status": …, …}]}; a few processes at
// most, those that started first.
[[nodiscard]] Dictionary processFacts(const std::filesystem::path& procRoot, std::string_view name,
                                      const Deadline& deadline);

}  // namespace halvox::platform::linux_
