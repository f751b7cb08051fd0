#pragma once

#include <chrono>
#include <optional>
#include <ostream>
#include <string>

#include "platform/ioreport.h"
#include "tools/Command.h"

namespace halvox::tools {

// A request for the driver channels.
struct ShowDrivers {
  std::string group{};  // empty: all groups
  std::optional<std::chrono::milliseconds> watch{};
};

// Formats one channel on one line, without a line end. If `seconds` is set, the counts are those of
// that many seconds and are shown per second. Otherwise they are shown as they are.
std::string formatChannel(const platform::IOReportChannel& channel, std::optional<double> seconds,
                          OutputForm form);

// Prints the current driver channels with their values, read from the sources that the
// configuration names. With --watch, prints their changes per second until the output is closed.
// `outputDescriptor` is the descriptor of `out`. Does not need the service.
ExitStatus showDrivers(const ShowDrivers& request, OutputForm form, std::ostream& out,
                       int outputDescriptor, std::ostream& errors);

}  // namespace halvox::tools
