#pragma once

#include <ostream>

#include "tools/Command.h"
#include "tools/Events.h"

namespace halvox::tools {

// Prints the summaries of sessions as a table, newest last: those of the files that were asked for,
// or the newest that the service left; of a single file its messages too. As JSON, one object a
// line. What cannot be read is told on `errors`, and the rest is shown.
ExitStatus showSummaries(const ShowSummaries& request, EventForm form, std::ostream& out,
                         std::ostream& errors);

}  // namespace halvox::tools
