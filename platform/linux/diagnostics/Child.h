#pragma once

#include <cstddef>
#include <string>
#include <vector>

#include "platform/linux/diagnostics/BoundedFile.h"
#include "platform/linux/diagnostics/WaitableFlag.h"

namespace halvox::platform::linux_ {

// Runs a program and collects its standard output. Blocks until the program has ended, at most
// until the deadline.
//
// There is no shell. The program has an empty standard input, none of this process's descriptors,
// no blocked or ignored signals, and only the environment variables that a client of a sound
// server needs.
//
// At the deadline the program and the processes that it started are killed; the finding is then a
// failure. They are also killed when the program prints more than `most` bytes; the finding then
// has the first `most` bytes and is marked as cut. A program that is not installed, and one that
// ends with a signal or a status other than 0, are failures.
[[nodiscard]] Finding runProgram(const std::vector<std::string>& command, std::size_t most,
                                 const CaptureDeadline& deadline);

}  // namespace halvox::platform::linux_
