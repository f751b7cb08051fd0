#pragma once

#include "platform/statistics.h"

namespace halvox {

// What the bridges to the back-ends count. The power log bridge and the issue metric bridge keep no
// state; their callers hold the counters and pass them to each call. The counters belong to
// `statistics`, which must outlive these structs. Any thread may count.

// received = delivered + unknown.
struct PowerLogCounters {
  explicit PowerLogCounters(platform::StatisticsService& statistics)
      : received(statistics.counter("power log bridge", "received")),
        delivered(statistics.counter("power log bridge", "delivered")),
        unknown(statistics.counter("power log bridge", "dropped: no known report")) {}

  platform::Counter& received;
  platform::Counter& delivered;
  platform::Counter& unknown;
};

// received = delivered.
struct IssueMetricCounters {
  explicit IssueMetricCounters(platform::StatisticsService& statistics)
      : received(statistics.counter("issue metrics bridge", "received")),
        delivered(statistics.counter("issue metrics bridge", "delivered")) {}

  platform::Counter& received;
  platform::Counter& delivered;
};

// received = delivered (to the bug-capture service) + counted + repeated. The bug-capture state
// manager holds these counters itself.
struct BugCaptureCounters {
  explicit BugCaptureCounters(platform::StatisticsService& statistics)
      : received(statistics.counter("bug capture bridge", "received")),
        delivered(statistics.counter("bug capture bridge", "delivered")),
        counted(statistics.counter("bug capture bridge", "suppressed: first of two")),
        repeated(statistics.counter("bug capture bridge", "suppressed: repeated")) {}

  platform::Counter& received;
  platform::Counter& delivered;
  platform::Counter& counted;
  platform::Counter& repeated;
};

}  // namespace halvox
