#include <utility>

#include "backends/HVReportingUtility.h"
#include "platform/services.h"
#include "platform/statistics.h"
#include "session/HVReportingSession.h"
#include "session/SessionLog.h"
#include "session/TracePoints.h"

namespace halvox {
namespace {

using platform::Dictionary;

// received = recorded + suppressed + not recorded.
struct MessageCounters {
  platform::Counter& received;
  platform::Counter& recorded;
  platform::Counter& redundant;
  platform::Counter& notStarted;
};

const MessageCounters& counters() {
  constexpr std::string_view kPiece = "session";
  platform::StatisticsService& statistics = platform::statistics();
  static const MessageCounters made{statistics.counter(kPiece, "received"),
                                    statistics.counter(kPiece, "recorded"),
                                    statistics.counter(kPiece, "suppressed: redundant"),
                                    statistics.counter(kPiece, "not recorded: not started")};
  return made;
}

// Errors are never suppressed, however often they repeat. The category is compared as a whole: an
// error category with a domain is not exempt.
bool isExemptFromSuppression(AudioEventCategory category, AudioEventType type) {
  return category == AudioEventCategory::kError || type == AudioEventType::kError;
}

}  // namespace

void HVReportingSession::sendMessage(const platform::Message& message, AudioEventCategory category,
                                     AudioEventType type, const ErrorReply& reply,
                                     const Account& sender) {
  sendMessage(message, category, type, false, reply, sender);
}

void HVReportingSession::sendMessage(const platform::Message& message, AudioEventCategory category,
                                     AudioEventType type, bool /*sync*/, const ErrorReply& reply,
                                     const Account& sender) {
  kSessionLog.debug("sending message for session owned by ", number(reporterID_));
  const Dictionary tagged = HVReportingUtilityAddAudioMessageTag(
      HVReportingUtilityRemoveWhiteSpaceFromKeys(message.value_or(Dictionary())), category, type);
  const bool isRedundant = record(category, type, tagged);
  emitTracePoint(ReportingTracePoint::kMessageSent);
  const bool wasStarted = started();
  if (tlmReportingEnabled()) {
    submitToLink({.original = message,
                  .tagged = tagged,
                  .category = category,
                  .type = type,
                  .wasStarted = wasStarted,
                  .isRedundant = isRedundant,
                  .sender = sender != nullptr ? sender : account_});
  }
  if (reply) reply(std::nullopt);
}

bool HVReportingSession::record(AudioEventCategory category, AudioEventType type,
                                const Dictionary& message) {
  counters().received.add();
  const HistoryLock history = history_.lock();
  const bool redundant = createMessageIdentifierWithCategory(history, category, type, message);
  if (redundant) {
    counters().redundant.add();
  } else {
    (history->has_value() ? counters().recorded : counters().notStarted).add();
  }
  return redundant;
}

bool HVReportingSession::createMessageIdentifierWithCategory(const HistoryLock& history,
                                                             AudioEventCategory category,
                                                             AudioEventType type,
                                                             const Dictionary& message) {
  if (!history->has_value()) return false;
  MessageHistory& messages = **history;
  const std::size_t before = messages.memorySize();
  MessageHistory::Base& base = messages.base(category, type);
  const Dictionary* previous = messages.newestMessage(base);
  if (previous != nullptr && !isExemptFromSuppression(category, type) &&
      equalApartFromVolatileKeys(*previous, message)) {
    kSessionLog.debug("dropping redundant event");
    charge(before, messages.memorySize());  // a base may be known by one more code now
    return true;
  }
  messages.append(base, message);
  charge(before, messages.memorySize());
  return false;
}

}  // namespace halvox
