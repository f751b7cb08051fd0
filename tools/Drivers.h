#pragma once

#include <chrono>
#include <optional>
#include <ostream>
#include <string>

#include "platform/ioreport.h"
#include "tools/Command.h"

namespace halvox::tools {

// The driver channels that there are.
struct ShowDrivers {
  std::string group{};  // empty: all
  std::optional<std::chrono::milliseconds> watch{};
};

// One channel on one line, without its end. With `seconds` its counts are those of that time and
// are shown per second; else they are shown as they are.
std::string formatChannel(const platform::IOReportChannel& channel, std::optional<double> seconds,
                          OutputForm form);

// Prints the driver channels that there are now with their values, read from the sources that the
// configuration names; with --watch what they change by per second, until the output is closed.
// `outputDescriptor` is what `out` writes to.
ExitStatus showDrivers(const ShowDrivers& request, OutputForm form, std::ostream& out,
                       int outputDescriptor, std::ostream& errors);

}  // namespace halvox::tools
