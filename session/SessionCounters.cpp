#include "session/SessionCounters.h"

#include <string_view>

namespace halvox {
namespace {

// Looks up the counters of one piece of the service.
class Piece {
 public:
  Piece(platform::StatisticsService& statistics, std::string_view name)
      : statistics_(statistics), name_(name) {}
  platform::Counter& operator[](std::string_view counter) const {
    return statistics_.counter(name_, counter);
  }

 private:
  platform::StatisticsService& statistics_;
  std::string_view name_;  // a constant
};

SessionCounters::Messages messagesOf(const Piece& piece) {
  return {.received = piece["received"],
          .recorded = piece["recorded"],
          .redundant = piece["suppressed: redundant"],
          .notStarted = piece["not recorded: not started"],
          .noRoom = piece["not recorded: no room"]};
}

SessionCounters::Link linkOf(const Piece& piece) {
  return {.received = piece["received"],
          .sent = piece["sent"],
          .failed = piece["failed"],
          .single = piece["passed on: single message"],
          .redundant = piece["suppressed: redundant"],
          .notAllowed = piece["dropped: transactions not allowed"],
          .testSession = piece["dropped: test session"],
          .noBackend = piece["dropped: no back-end"],
          .failureLog = std::make_shared<FailureLog>()};
}

SessionCounters::SingleMessages singleMessagesOf(const Piece& piece) {
  return {.received = piece["received"],
          .sent = piece["sent"],
          .failed = piece["failed"],
          .sampled = piece["suppressed: sampled"],
          .failureLog = std::make_shared<FailureLog>()};
}

}  // namespace

SessionCounters::SessionCounters(platform::StatisticsService& statistics)
    : messages(messagesOf({statistics, "session"})),
      link(linkOf({statistics, "link"})),
      single(singleMessagesOf({statistics, "single messages"})),
      startRepliesDropped(statistics.counter("start replies", "dropped: session released")) {}

}  // namespace halvox
