#pragma once

#include <cstdint>

#include "tools/TraceResults.h"
#include "tools/export/PerfettoTrace.h"

namespace halvox::tools {

// Adds the intervals of a results file: a process with a track for each measurement. The file has
// the lengths of the intervals but not their times. They therefore follow each other and end at
// `end`, when the file was written; the names of the tracks say so. Returns how many were added.
std::uint64_t addIntervals(PerfettoTrace& trace, const TraceResults& results,
                           PerfettoTrace::Time end);

}  // namespace halvox::tools
