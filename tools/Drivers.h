#pragma once

#include <ostream>
#include <string>

#include "platform/ioreport.h"
#include "tools/Command.h"
#include "tools/Events.h"

namespace halvox::tools {

// One channel on one line, without its end. With `seconds` its counts are those of that time and
// are shown per second; else they are shown as they are.
std::string formatChannel(const platform::IOReportChannel& channel, std::optional<double> seconds,
                          EventForm form);

// Prints the driver channels that there are now with their values, read from the sources that the
// configuration names; with --watch what they change by per second, until the output is closed.
// `outputDescriptor` is what `out` writes to.
ExitStatus showDrivers(const ShowDrivers& request, EventForm form, std::ostream& out,
                       int outputDescriptor, std::ostream& errors);

}  // namespace halvox::tools
