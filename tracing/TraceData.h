#pragma once

#include <cstdint>
#include <string>
#include <utility>
#include <vector>

#include "platform/ktrace.h"

namespace halvox {

// One measurement of a trace: a name and the values found for it.
//
// Its trace owns it. Used by one thread at a time. Values and the count accumulate over several
// passes.
class TraceData {
 public:
  using Session = platform::KtraceService::Session;
  using Events = std::vector<platform::trace_point>;

  explicit TraceData(std::string name) : name_(std::move(name)) {}
  TraceData(const TraceData&) = delete;
  TraceData& operator=(const TraceData&) = delete;
  virtual ~TraceData() = default;

  // Looks for values in the events of one trace, which are in the order of their arrival.
  virtual void processTracepoints(const Session& session, const Events& events) = 0;

  [[nodiscard]] const std::string& name() const { return name_; }
  [[nodiscard]] bool hasResults() const { return !results_.empty(); }
  // In the order in which they were found.
  [[nodiscard]] std::vector<std::uint64_t> getResults() const { return results_; }
  // Sum and division are in single precision, as the interface demands. Without results the average
  // is not a number.
  [[nodiscard]] float getAverageResult() const;
  // The number of measured intervals. The values of a TracePoint leave it at 0.
  [[nodiscard]] std::uint32_t getNumTimesTraced() const { return count_; }

 protected:
  // The two are separate because a TracePoint adds results that do not count as traced.
  void addResult(std::uint64_t value) { results_.push_back(value); }
  void countOne() { ++count_; }

 private:
  const std::string name_;
  std::vector<std::uint64_t> results_;
  std::uint32_t count_ = 0;
};

}  // namespace halvox
