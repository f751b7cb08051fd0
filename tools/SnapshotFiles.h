#pragma once

#include <ostream>
#include <string>

#include "tools/Command.h"

namespace halvox::tools {

// Requests about archives of diagnostics. The file "newest" stands for the newest one of the
// service.
struct ShowSnapshot {
  std::string file{};
};
struct ExtractSnapshot {
  std::string file{};
  std::string directory{};  // empty: named like the archive, in the working directory
  bool force = false;       // replace existing files
};

// Prints the signature and the contents of a snapshot. Escapes characters that could control a
// terminal.
ExitStatus showSnapshot(const ShowSnapshot& request, OutputForm form, std::ostream& out,
                        std::ostream& errors);

// Unpacks a snapshot and prints the names of its files.
ExitStatus extractSnapshot(const ExtractSnapshot& request, OutputForm form, std::ostream& out,
                           std::ostream& errors);

}  // namespace halvox::tools
