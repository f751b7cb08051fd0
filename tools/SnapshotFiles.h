#pragma once

#include <ostream>
#include <string>

#include "tools/Command.h"

namespace halvox::tools {

// Archives of diagnostics; the file "newest" is the newest of the service's.
struct ShowSnapshot {
  std::string file{};
};
struct ExtractSnapshot {
  std::string file{};
  std::string directory{};  // empty: one named as the archive, in the working directory
  bool force = false;       // replaces files that are there
};

// Prints what a snapshot is about and what is in it. What is in an archive cannot drive a terminal.
ExitStatus showSnapshot(const ShowSnapshot& request, OutputForm form, std::ostream& out,
                        std::ostream& errors);

// Unpacks a snapshot and prints the files that it made.
ExitStatus extractSnapshot(const ExtractSnapshot& request, OutputForm form, std::ostream& out,
                           std::ostream& errors);

}  // namespace halvox::tools
