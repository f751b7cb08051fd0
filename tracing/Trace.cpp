#include "tracing/Trace.h"

#include <utility>

namespace halvox {

void Trace::addTraceDataToCollect(std::unique_ptr<TraceInterval> interval) {
  measurements_.push_back(std::move(interval));
}

void Trace::processTracepoints(const TraceData::Session& session, const TraceData::Events& events) {
  for (const auto& measurement : measurements_) measurement->processTracepoints(session, events);
}

// Does not clear what an earlier call added (see the header).
Trace::Results Trace::getResults() {
  for (const auto& measurement : measurements_) {
    for (const std::uint64_t value : measurement->getResults()) {
      // A multimap keeps equal names in the order of insertion, which is that of the measurements.
      results_.emplace(measurement->name(), value);
    }
  }
  return results_;
}

}  // namespace halvox
