#pragma once

#include <cstdint>
#include <ostream>
#include <string>
#include <vector>

#include "tools/Command.h"

namespace halvox::tools {

// The summaries that the service leaves of its sessions on internal builds.
struct ShowSummaries {
  std::vector<std::string> files{};  // none: the newest of the service's
  std::uint64_t last = 10;
};

// Prints the summaries of sessions as a table, newest last: those of the files that were asked for,
// or the newest that the service left; of a single file its messages too. As JSON, one object a
// line. What cannot be read is told on `errors`, and the rest is shown.
ExitStatus showSummaries(const ShowSummaries& request, OutputForm form, std::ostream& out,
                         std::ostream& errors);

}  // namespace halvox::tools
