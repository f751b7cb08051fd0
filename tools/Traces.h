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

// Has the service trace while a program runs, and prints what was measured. The service must be one
// whose configuration this is and trace at all. Says what is wrong in the trace parameters file,
// and does not run the program when nothing in the file can be measured. Fails when the program
// does, when the service refuses, when it leaves no new results, and when nothing was measured.
ExitStatus recordTrace(const RecordTrace& request, const CommonOptions& options, std::ostream& out,
                       std::ostream& errors);

// Prints for each measurement of a results file how many values it has and which; as JSON, one
// object a line.
ExitStatus showTrace(const ShowTrace& request, OutputForm form, std::ostream& out,
                     std::ostream& errors);

// Writes the intervals of a results file in the Trace Event form: a track for each measurement, on
// which its intervals stand one behind the other, because results tell how long they took but not
// when they were.
ExitStatus exportTrace(const ExportTrace& request, OutputForm form, std::ostream& out,
                       std::ostream& errors);

}  // namespace halvox::tools
