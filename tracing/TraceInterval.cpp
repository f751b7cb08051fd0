#include "tracing/TraceInterval.h"

#include <map>

#include "platform/services.h"
#include "tracing/TraceLog.h"

namespace halvox {
namespace {

constexpr const char* kUnit = "TraceInterval";
constexpr std::uint64_t kNoStart = 0;

struct Discarded {
  std::uint32_t starts = 0;
  std::uint32_t stops = 0;
};

// The line about stops prints the number of starts. This is part of the interface. The two levels
// are too: a single-thread interval logs at debug level, an any-thread interval at default level.
void logDiscarded(platform::LogLevel level, const Discarded& discarded, const std::string& name) {
  platform::LogCategory& category = HVReportingTraceCategory();
  if (discarded.starts != 0) {
    platform::UnitLog::logTo(category, kUnit, level, "DISCARDED ", discarded.starts,
                             " trace Start points for interval ", name,
                             " because no stop points found");
  }
  if (discarded.stops != 0) {
    platform::UnitLog::logTo(category, kUnit, level, "DISCARDED ", discarded.starts,
                             " trace Stop points for interval ", name,
                             " because no start points found");
  }
}

}  // namespace

void TraceInterval::processTracepoints(const Session& session, const Events& events) {
  if (codes_.matchByThread) {
    processTracepointsSingleThread(session, events);
  } else {
    processTracepointsAnyThread(session, events);
  }
}

void TraceInterval::processTracepointsSingleThread(const Session& session, const Events& events) {
  std::map<std::uint64_t, std::uint64_t> starts;  // by thread: the begin that waits for its end
  Discarded discarded;
  for (const platform::trace_point& event : events) {
    // Begins are tested first: a code that is both a begin and an end is a begin, here and below.
    if (event.debugid == codes_.begin) {
      const bool isNew = starts.insert_or_assign(event.threadid, event.timestamp).second;
      if (!isNew) ++discarded.starts;
    } else if (event.debugid == codes_.end) {
      const auto start = starts.find(event.threadid);
      if (start == starts.end()) {
        ++discarded.stops;
        continue;
      }
      addInterval(session, start->second, event.timestamp);
      starts.erase(start);
    }
  }
  logDiscarded(platform::LogLevel::kDebug, discarded, name());
}

void TraceInterval::processTracepointsAnyThread(const Session& session, const Events& events) {
  std::uint64_t start = kNoStart;
  Discarded discarded;
  for (const platform::trace_point& event : events) {
    if (event.debugid == codes_.begin) {
      if (start != kNoStart) ++discarded.starts;
      start = event.timestamp;
    } else if (event.debugid == codes_.end) {
      if (start == kNoStart) {
        ++discarded.stops;
      } else {
        addInterval(session, start, event.timestamp);
      }
      // Cleared even if there was no start; a tick of 0 is the same as none. Both are
      // required.
      start = kNoStart;
    }
  }
  logDiscarded(platform::LogLevel::kDefault, discarded, name());
}

void TraceInterval::addInterval(const Session& session, std::uint64_t begin, std::uint64_t end) {
  // Converts each timestamp before subtracting. The conversion rounds, and converting the
  // difference would therefore give another result.
  const platform::KtraceService& ktrace = platform::ktrace();
  addResult(ktrace.ktrace_convert_timestamp_to_nanoseconds(session, end) -
            ktrace.ktrace_convert_timestamp_to_nanoseconds(session, begin));
  countOne();
}

}  // namespace halvox
