#pragma once

#include <cstddef>
#include <string>
#include <vector>

#include "platform/linux/diagnostics/BoundedFile.h"
#include "platform/linux/diagnostics/WaitableFlag.h"

namespace halvox::platform::linux_ {

// Runs a program, without a shell, and collects what it prints on standard output; it gets nothing
// to read, no open file of ours and only the environment that a sound server's client needs. It is
// killed, with what it started, at the deadline and when it prints more than `most` bytes, of which
// the first are kept in the second case alone. A program that is not there, and one that does not
// end with status 0, are failures.
[[nodiscard]] Finding runProgram(const std::vector<std::string>& command, std::size_t most,
                                 const Deadline& deadline);

}  // namespace halvox::platform::linux_
