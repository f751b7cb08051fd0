#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <string>
#include <vector>

#include "tracing/TraceData.h"
#include "tracing/TraceInterval.h"

namespace halvox {

// One trace: what to measure in its events, and what was measured. Owned by the runner.
class Trace {
 public:
  // Values by measurement; those of one name in the order in which they were found.
  using Results = std::multimap<std::string, std::uint64_t>;
  enum class Kind : std::uint8_t { kKernelTrace, kSignpost };

  Trace(std::string name, Kind kind) : name_(std::move(name)), kind_(kind) {}

  [[nodiscard]] const std::string& name() const { return name_; }
  [[nodiscard]] bool isKernelTrace() const { return kind_ == Kind::kKernelTrace; }

  void addTraceDataToCollect(std::unique_ptr<TraceInterval> interval);
  // Lets every measurement look through the events, in the order in which they were added.
  void processTracepoints(const TraceData::Session& session, const TraceData::Events& events);
  // Gathers what the measurements found and returns all that was ever gathered: a second call
  // returns every value twice. Call it once.
  Results getResults();

 private:
  const std::string name_;
  const Kind kind_;
  std::vector<std::unique_ptr<TraceData>> measurements_;
  Results results_;
};

}  // namespace halvox
