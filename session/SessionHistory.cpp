#include "session/SessionHistory.h"

#include "session/SessionLog.h"

namespace halvox {
namespace {

// Errors are never suppressed, however often they repeat. The category is compared as a whole, so
// an error category with a domain is not exempt; this is required.
bool isExemptFromSuppression(AudioEventCategory category, AudioEventType type) {
  return category == AudioEventCategory::kError || type == AudioEventType::kError;
}

}  // namespace

void SessionHistory::begin() { history_.set(MessageHistory()); }

std::optional<MessageHistory> SessionHistory::end() {
  std::optional<MessageHistory> history = history_.take();
  // The charge ends here: the history itself does not know the account.
  held_.change(history.has_value() ? history->memorySize() : 0, 0);
  return history;
}

std::size_t SessionHistory::size() const {
  const Lock history = lock();
  return history->has_value() ? (*history)->size() : 0;
}

SessionHistory::Outcome SessionHistory::recordLocked(const Lock& history,
                                                     AudioEventCategory category,
                                                     AudioEventType type,
                                                     const platform::Dictionary& message) {
  if (!history->has_value()) return Outcome::kNotStarted;
  MessageHistory& messages = **history;
  const std::size_t before = messages.memorySize();
  MessageHistory::Base& base = messages.base(category, type);
  // Only the newest message of the same category and type is compared, however old it is. Of the
  // messages A, B, A all three are recorded, and two equal messages an hour apart are a repetition.
  // Both are required.
  const platform::Dictionary* previous = messages.newestMessage(base);
  if (previous != nullptr && !isExemptFromSuppression(category, type) &&
      equalApartFromVolatileKeys(*previous, message)) {
    kSessionLog.debug("dropping redundant event");
    // Nothing was recorded, but the table of codes may have grown.
    held_.change(before, messages.memorySize());
    return Outcome::kRedundant;
  }
  messages.append(base, message);
  held_.change(before, messages.memorySize());
  return Outcome::kRecorded;
}

}  // namespace halvox
