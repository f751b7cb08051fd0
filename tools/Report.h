#pragma once

#include <optional>
#include <string>

#include "tools/Command.h"

namespace halvox::tools {

struct WriteReport {
  std::string to{};               // the file to write, or "-" for the standard output
  std::optional<double> since{};  // seconds since 1970
  std::optional<double> until{};
  std::string database{};  // empty: as the service's configuration says
};

// Writes a page about the stored records of a period: one HTML file that needs no network. Replaces
// an existing file, in one step. A service may write to the store meanwhile.
ExitStatus writeReport(const WriteReport& request, const CommonOptions& options,
                       const ToolStreams& streams);

}  // namespace halvox::tools
