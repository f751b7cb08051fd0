#pragma once

#include <cstdint>
#include <ostream>
#include <string>
#include <vector>

#include "tools/Command.h"

namespace halvox::tools {

// Where the service writes summary files. Relative, because it is below the service's storage root.
inline constexpr const char* kSummaryDirectory =
    "private/var/mobile/Library/Logs/Wreckbin/DiagnosticLogs/Audio/Reporting";

// A request for summaries of sessions, which internal builds of the service write.
struct ShowSummaries {
  std::vector<std::string> files{};  // empty: the newest ones of the service
  std::uint64_t last = 10;
};

// Prints summaries of sessions as a table, newest last: those of the named files, or the newest
// ones of the service. Also prints the messages if a single file is named. JSON output has one
// object on each line. Reports files that cannot be read on `errors` and shows the others.
ExitStatus showSummaries(const ShowSummaries& request, OutputForm form, std::ostream& out,
                         std::ostream& errors);

}  // namespace halvox::tools
