#include "service/ServiceCounters.h"

namespace halvox {

ServiceCounters::ServiceCounters(platform::StatisticsService& statistics)
    : requests{.received = statistics.counter("requests", "received"),
               .carriedOut = statistics.counter("requests", "carried out")},
      messages{.received = statistics.counter("messages", "received"),
               .delivered = statistics.counter("messages", "delivered"),
               .noSession = statistics.counter("messages", "dropped: no session found"),
               .disabled = statistics.counter("messages", "refused: reporting disabled")},
      startReplies{.heldBack = statistics.counter("start replies", "held back"),
                   .delivered = statistics.counter("start replies", "delivered")},
      powerLog(statistics),
      issueMetrics(statistics),
      sessions(SessionCounters::make(statistics)) {}

}  // namespace halvox
