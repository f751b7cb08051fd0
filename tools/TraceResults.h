#pragma once

#include <filesystem>
#include <ostream>
#include <string>
#include <utility>
#include <vector>

#include "platform/linux/base/Result.h"

namespace halvox::tools {

// The content of a results file. Values are in nanoseconds.
struct TraceResults {
  std::string product{};
  std::vector<std::pair<std::string, std::vector<double>>> values{};  // in the file's order
};

// Statistics of the values of one measurement, in nanoseconds.
struct TraceStatistics {
  std::size_t count = 0;
  double minimum = 0;
  double median = 0;        // of an even number of values, the lower of the two in the middle
  double percentile95 = 0;  // the smallest value that at least 95 % of the values do not exceed
  double percentile99 = 0;
  double maximum = 0;
};

// Returns the results, or what is wrong with the file.
platform::linux_::Result<TraceResults> readTraceResults(const std::string& file);

// `values` must not be empty.
TraceStatistics statisticsOf(std::vector<double> values);

// Returns where the service writes results below its storage root.
std::filesystem::path traceResultsFile(const std::filesystem::path& root);

// Writes the form that exportTrace() describes.
void writeTraceEvents(const TraceResults& results, std::ostream& out);

}  // namespace halvox::tools
