#pragma once

#include <ostream>
#include <string>
#include <utility>
#include <variant>
#include <vector>

namespace halvox::tools {

// What a results file says. Values are nanoseconds.
struct TraceResults {
  std::string product{};
  std::vector<std::pair<std::string, std::vector<double>>> values{};  // as they stand in the file
};

// What the values of one measurement come to.
struct TraceStatistics {
  std::size_t count = 0;
  double minimum = 0;
  double median = 0;        // of an even number the lower one of the middle
  double percentile95 = 0;  // the least value that 95 of 100 do not exceed
  double maximum = 0;
};

// The results, or what is wrong with the file.
std::variant<TraceResults, std::string> readTraceResults(const std::string& file);

// There must be values.
TraceStatistics statisticsOf(std::vector<double> values);

// See exportTrace().
void writeTraceEvents(const TraceResults& results, std::ostream& out);

}  // namespace halvox::tools
