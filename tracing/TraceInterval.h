#pragma once

#include <string>

#include "tracing/TraceData.h"

namespace halvox {

// Which event begins an interval, which ends it, and whether both must come from one thread.
struct TraceIntervalCodes {
  std::uint32_t begin = 0;
  std::uint32_t end = 0;
  bool matchByThread = false;
};

// Measures the nanoseconds from an event to the next one that ends it. An event that is both
// begins; a begin that is followed by another begin is discarded, and so is an end without a begin.
class TraceInterval : public TraceData {
 public:
  TraceInterval(std::string name, TraceIntervalCodes codes)
      : TraceData(std::move(name)), codes_(codes) {}

  void processTracepoints(const Session& session, const Events& events) override;
  // Begin and end must come from the same thread.
  virtual void processTracepointsSingleThread(const Session& session, const Events& events);
  // Begin and end may come from different threads. A begin at tick 0 counts as none.
  virtual void processTracepointsAnyThread(const Session& session, const Events& events);

 private:
  void addInterval(const Session& session, std::uint64_t begin, std::uint64_t end);

  const TraceIntervalCodes codes_;
};

}  // namespace halvox
