#pragma once

#include <optional>
#include <string>

#include "tools/Command.h"

namespace halvox::tools {

struct ExportRecords {
  std::string to{};               // the file to write
  bool replace = false;           // whether an existing file may be replaced
  std::optional<double> since{};  // seconds since 1970
  std::optional<double> until{};
  std::string database{};  // empty: as the service's configuration says
};

// Writes the stored records into a plain SQLite database, in which events and link messages are not
// compressed. A service may write to the store meanwhile.
ExitStatus exportRecords(const ExportRecords& request, const CommonOptions& options,
                         const ToolStreams& streams);

}  // namespace halvox::tools
