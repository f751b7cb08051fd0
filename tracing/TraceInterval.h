#pragma once

#include <string>

#include "tracing/TraceData.h"

namespace halvox {

// The event that begins an interval, the event that ends it, and whether both must come from the
// same thread. Codes are compared as whole identifiers, function qualifiers included.
struct TraceIntervalCodes {
  std::uint32_t begin = 0;
  std::uint32_t end = 0;
  bool matchByThread = false;
};

// Measures the nanoseconds from each begin event to the end event that follows it.
//
// An event that is both counts as a begin. A begin that another begin follows is discarded, and so
// is an end without a begin; the counts of both are logged. State between events lives only during
// one pass. Owner and thread are those of TraceData.
class TraceInterval : public TraceData {
 public:
  TraceInterval(std::string name, TraceIntervalCodes codes)
      : TraceData(std::move(name)), codes_(codes) {}

  void processTracepoints(const Session& session, const Events& events) override;
  // Begin and end must come from the same thread. One pass, with a map of the threads that have
  // begun.
  virtual void processTracepointsSingleThread(const Session& session, const Events& events);
  // Begin and end may come from different threads. A begin at tick 0 counts as no begin; this is
  // required.
  virtual void processTracepointsAnyThread(const Session& session, const Events& events);

 private:
  // Adds the nanoseconds between two ticks of the trace's clock.
  void addInterval(const Session& session, std::uint64_t begin, std::uint64_t end);

  const TraceIntervalCodes codes_;
};

}  // namespace halvox
