#pragma once

#include "analysis/RecordSource.h"

#include "tools/export/PerfettoTrace.h"

namespace halvox::tools {

// Draws what the service dropped, suppressed or refused: a process for the service, and in it an
// instant for each loss at the time when it was recorded. Without losses there is no process.
// Belongs to one thread.
class PerfettoLosses {
 public:
  // Owns nothing; the trace must outlive it.
  explicit PerfettoLosses(PerfettoTrace& trace) : trace_(trace) {}

  // Ignores records of other kinds.
  void add(const analysis::Record& record);

 private:
  PerfettoTrace& trace_;
  bool isDescribed_ = false;
};

}  // namespace halvox::tools
