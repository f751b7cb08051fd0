#pragma once

#include <optional>
#include <string>
#include <vector>

#include "analysis/BucketCounts.h"
#include "analysis/Comparison.h"
#include "analysis/ReportData.h"

namespace halvox::tools {

// One measurement of a trace.
struct ReportTraceInterval {
  std::string name{};
  std::uint64_t count = 0;
  // Values that were measured, in microseconds.
  double median = 0;
  double percentile95 = 0;
  double percentile99 = 0;
  double maximum = 0;
  analysis::BucketCounts counts{};  // microseconds
};

// The newest results of a trace.
struct ReportTrace {
  std::string file{};
  double when = 0;  // when it was written, in seconds since 1970
  std::vector<ReportTraceInterval> intervals{};
};

// What a report says besides the records. Times are seconds since 1970.
struct ReportFrame {
  std::string program{};  // with its version
  std::string store{};    // the path of the database
  double made = 0;
  std::optional<double> since{};  // what was asked for
  std::optional<double> until{};
  std::optional<ReportTrace> trace{};
  std::vector<std::string> notes{};  // what a reader must know about what is not in the report
};

// Appends the report as the JSON object that the page reads (docs/report.md). It can stand in a
// script element of HTML: "<" is escaped. Texts that are not UTF-8 have U+FFFD for each wrong byte.
void appendReportJson(const analysis::ReportData& data, const ReportFrame& frame,
                      std::string& page);

// What the page of a comparison says besides the changes.
struct ComparisonFrame {
  struct Side {
    std::string store{};  // the path of the database
    const analysis::ReportData& data;
  };
  std::string program{};  // with its version
  double made = 0;        // seconds since 1970
  Side before;
  Side after;
};

// Appends a comparison in the same way.
void appendComparisonJson(const ComparisonFrame& frame,
                          const std::vector<analysis::Change>& changes, std::string& page);

}  // namespace halvox::tools
