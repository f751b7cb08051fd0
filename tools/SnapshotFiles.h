#pragma once

#include <ostream>

#include "tools/Command.h"
#include "tools/Events.h"

namespace halvox::tools {

// Prints what a snapshot is about and what is in it. What is in an archive cannot drive a terminal.
ExitStatus showSnapshot(const ShowSnapshot& request, EventForm form, std::ostream& out,
                        std::ostream& errors);

// Unpacks a snapshot and prints the files that it made.
ExitStatus extractSnapshot(const ExtractSnapshot& request, EventForm form, std::ostream& out,
                           std::ostream& errors);

}  // namespace halvox::tools
