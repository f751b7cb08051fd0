#include "tools/EventRows.h"

#include <utility>

#include "analysis/MessageNames.h"

namespace halvox::tools {

using platform::linux_::RecordOrder;
using platform::linux_::StoredEvent;

void EventRows::add(const StoredEvent& event) {
  const bool isShown = std::exchange(shownBefore_, std::nullopt) == event.id;
  if (last_ && isPartner(event)) {
    // The partner that comes second is shown only if the first one was held back.
    const bool isFirstShown = last_->isShown;
    last_.reset();
    if (!isFirstShown) show_(event);
    return;
  }
  flush();
  last_.reset();
  const analysis::EventNameParts parts = analysis::splitEventName(event.name);
  const bool isFirstName = parts.service == analysis::kCommonService;
  const bool mayHavePartner =
      !parts.service.empty() && isFirstName == (order_ == RecordOrder::kOldestFirst);
  const bool isHeldBack = mayHavePartner && order_ == RecordOrder::kOldestFirst && !isShown;
  if (!isHeldBack && !isShown) show_(event);
  if (mayHavePartner) remember(event, !isHeldBack);
}

void EventRows::flush() {
  if (!last_ || std::exchange(last_->isShown, true)) return;
  show_({last_->id, last_->time, last_->name, last_->payload, last_->application});
}

void EventRows::remember(const StoredEvent& event, bool isShown) {
  last_ = Copy{event.id,
               event.time,
               std::string(event.name),
               std::string(event.payload),
               std::string(event.application),
               isShown};
}

bool EventRows::isPartner(const StoredEvent& event) const {
  const analysis::EventNameParts before = analysis::splitEventName(last_->name);
  const analysis::EventNameParts parts = analysis::splitEventName(event.name);
  const bool isFirstName = parts.service == analysis::kCommonService;
  return !parts.service.empty() && isFirstName == (order_ == RecordOrder::kNewestFirst) &&
         parts.category == before.category && parts.type == before.type &&
         event.payload == last_->payload;
}

}  // namespace halvox::tools
