#pragma once

#include <filesystem>
#include <string_view>

#include "platform/linux/diagnostics/WaitableFlag.h"
#include "platform/value.h"

namespace halvox::platform::linux_ {

// Collects what the kernel knows about the processes with command name `name` (at most 15 bytes, as
// the kernel keeps it): status, command line, limits, control group, a summary of the memory
// mappings, the number of open files, and the threads. Never reads the environment, the content of
// open files or memory, because these may hold a user's secrets. Facts that cannot be read are
// listed under "not_readable" with the reason. May block on the disk, but on nothing else. Stops at
// the deadline.
//
//   {"name": …, "found": <number>, "processes": [{"pid": …, "status": …, …}]}
//
// Describes at most 8 processes, those with the lowest numbers; "found" counts all.
[[nodiscard]] Dictionary processFacts(const std::filesystem::path& procRoot, std::string_view name,
                                      const CaptureDeadline& deadline);

}  // namespace halvox::platform::linux_
