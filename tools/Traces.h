#pragma once

#include <ostream>
#include <string>
#include <vector>

#include "tools/Command.h"

namespace halvox::tools {

struct RecordTrace {
  std::string params{};                // the trace parameters file
  std::vector<std::string> command{};  // the program and its arguments
};
struct ShowTrace {
  std::string file{};
};
struct ExportTrace {
  std::string file{};
  std::string to{};
};

// Lets the service trace while a program runs, and prints what was measured. The service must use
// the configuration that this program finds, and tracing must be enabled in it. Reports errors in
// the trace parameters file, and does not run the program if nothing in the file can be measured.
// Fails if the program fails, the service refuses, there are no new results, or nothing was
// measured.
ExitStatus recordTrace(const RecordTrace& request, const CommonOptions& options, std::ostream& out,
                       std::ostream& errors);

// Prints statistics of each measurement in a results file; as JSON, one object on each line.
ExitStatus showTrace(const ShowTrace& request, OutputForm form, std::ostream& out,
                     std::ostream& errors);

// Writes the intervals of a results file as Trace Event JSON. Each measurement has a track, on
// which its intervals follow each other, because results hold how long intervals took but not when
// they began.
ExitStatus exportTrace(const ExportTrace& request, OutputForm form, std::ostream& out,
                       std::ostream& errors);

}  // namespace halvox::tools
