#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "tracing/TraceData.h"
#include "tracing/TraceInterval.h"

namespace halvox {

// One trace: the measurements to make in its events, and their results.
//
// The runner owns it. Used by one thread at a time: by the runner's queue while it records, by the
// stopping thread afterwards. No operation fails.
class Trace {
 public:
  // Nanoseconds, or arguments of events, by the name of their measurement. Values of one name are
  // in the order in which they were found.
  using Results = std::multimap<std::string, std::uint64_t>;
  enum class Kind : std::uint8_t { kKernelTrace, kSignpost };

  Trace(std::string name, Kind kind) : name_(std::move(name)), kind_(kind) {}

  [[nodiscard]] const std::string& name() const { return name_; }
  [[nodiscard]] bool isKernelTrace() const { return kind_ == Kind::kKernelTrace; }

  // Adds a measurement, after those that were added before.
  void addTraceDataToCollect(std::unique_ptr<TraceInterval> interval);
  // Passes the events to every measurement, in the order in which the measurements were added.
  void processTracepoints(const TraceData::Session& session, const TraceData::Events& events);
  // Adds the results of all measurements to the results of the trace, and returns the results of
  // the trace. A second call adds them again and returns every value twice, which is required. Call
  // it once.
  Results getResults();

 private:
  const std::string name_;
  const Kind kind_;
  std::vector<std::unique_ptr<TraceData>> measurements_;
  Results results_;
};

}  // namespace halvox
