#include "tools/export/PerfettoIntervals.h"

#include <cmath>
#include <string>
#include <vector>

namespace halvox::tools {
namespace {

using Time = PerfettoTrace::Time;
using TrackKind = PerfettoTrace::TrackKind;

// Above those of the applications.
constexpr std::int32_t kPid = 1'000'000;

// The lengths that can be drawn: a results file may have values that are not numbers.
std::vector<Time> lengthsOf(const std::vector<double>& nanoseconds) {
  constexpr double kLongest = 1e15;  // eleven days
  std::vector<Time> lengths;
  for (const double value : nanoseconds) {
    if (value >= 0 && value < kLongest) lengths.emplace_back(std::llround(value));
  }
  return lengths;
}

}  // namespace

std::uint64_t addIntervals(PerfettoTrace& trace, const TraceResults& results, Time end) {
  const auto process = PerfettoTrace::track(TrackKind::kProcess, kPid);
  std::uint64_t added = 0;
  std::int64_t number = 0;
  for (const auto& [name, values] : results.values) {
    const std::vector<Time> lengths = lengthsOf(values);
    if (lengths.empty()) continue;
    if (added == 0) trace.describeProcess(process, kPid, "trace results");
    const auto track = PerfettoTrace::track(TrackKind::kInterval, ++number);
    trace.describeTrack(track, process, name + " (lengths in order; times are not recorded)");
    Time begin = end;
    for (const Time length : lengths) begin -= length;
    for (const Time length : lengths) {
      trace.beginSlice({.track = track, .time = begin, .name = name, .category = "trace"});
      begin += length;
      trace.endSlice({.track = track, .time = begin});
    }
    added += lengths.size();
  }
  return added;
}

}  // namespace halvox::tools
