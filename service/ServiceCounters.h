#pragma once

#include <memory>

#include "backends/BackEndCounters.h"
#include "platform/statistics.h"
#include "session/SessionCounters.h"

namespace halvox {

// What all clients of a service count together. The delegate looks them up once, because a look-up
// takes a lock and compares names; counting is one relaxed addition.
//
// Shared by the delegate and the clients. The counters belong to `statistics`, which must outlive
// them. Any thread may count.
struct ServiceCounters {
  explicit ServiceCounters(platform::StatisticsService& statistics);
  [[nodiscard]] static std::shared_ptr<const ServiceCounters> make(
      platform::StatisticsService& statistics) {
    return std::make_shared<const ServiceCounters>(statistics);
  }

  // received = carriedOut, once the reporting queue is empty.
  struct Requests {
    platform::Counter& received;
    platform::Counter& carriedOut;
  };
  // received = delivered + noSession + disabled.
  struct Messages {
    platform::Counter& received;
    platform::Counter& delivered;
    platform::Counter& noSession;
    platform::Counter& disabled;
  };
  // heldBack = delivered + the replies that wait + `sessions->startRepliesDropped`.
  struct StartReplies {
    platform::Counter& heldBack;
    platform::Counter& delivered;
  };

  Requests requests;
  Messages messages;
  StartReplies startReplies;
  PowerLogCounters powerLog;
  IssueMetricCounters issueMetrics;
  std::shared_ptr<const SessionCounters> sessions;
};

}  // namespace halvox
