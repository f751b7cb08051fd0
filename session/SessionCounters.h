#pragma once

#include <memory>

#include "platform/statistics.h"
#include "session/FailureLog.h"

namespace halvox {

// What all sessions of a service count together. They are looked up once for all sessions: a
// look-up takes a lock and compares names, while counting is one relaxed addition.
//
// Shared by the clients and the sessions. The counters belong to `statistics`, which must outlive
// every session and every waiting message. Any thread may count.
struct SessionCounters {
  explicit SessionCounters(platform::StatisticsService& statistics);
  [[nodiscard]] static std::shared_ptr<const SessionCounters> make(
      platform::StatisticsService& statistics) {
    return std::make_shared<const SessionCounters>(statistics);
  }

  // received = recorded + redundant + notStarted + noRoom.
  struct Messages {
    platform::Counter& received;
    platform::Counter& recorded;
    platform::Counter& redundant;
    platform::Counter& notStarted;
    platform::Counter& noRoom;
  };
  // received = sent + failed + single + redundant + notAllowed + testSession + noBackend + the
  // messages that wait in the queues.
  struct Link {
    platform::Counter& received;
    platform::Counter& sent;
    platform::Counter& failed;
    platform::Counter& single;
    platform::Counter& redundant;
    platform::Counter& notAllowed;
    platform::Counter& testSession;
    platform::Counter& noBackend;
    std::shared_ptr<FailureLog> failureLog;
  };
  // received = sent + failed + sampled + the messages whose delay of one second has not passed.
  struct SingleMessages {
    platform::Counter& received;
    platform::Counter& sent;
    platform::Counter& failed;
    platform::Counter& sampled;
    std::shared_ptr<FailureLog> failureLog;
  };

  Messages messages;
  Link link;
  SingleMessages single;
  // Replies to starts that are never sent, because the session is destroyed before it has been
  // stopped.
  platform::Counter& startRepliesDropped;
};

}  // namespace halvox
