#include "platform/linux/store/EventNames.h"

#include <algorithm>
#include <functional>
#include <utility>

#include <fnmatch.h>

namespace halvox::platform::linux_ {

EventNames::EventNames(std::vector<std::string> wantedPatterns)
    : wantedPatterns_(std::move(wantedPatterns)),
      slots_(std::make_unique<std::atomic<EventName*>[]>(kSlots)) {}

EventNames::~EventNames() {
  for (std::size_t index = 0; index < kSlots; ++index) {
    const std::unique_ptr<EventName> owned(slots_[index].load(std::memory_order_relaxed));
  }
}

EventName* EventNames::find(std::string_view name) {
  std::unique_ptr<EventName> made;
  std::size_t index = std::hash<std::string_view>{}(name) % kSlots;
  while (true) {
    EventName* present = slots_[index].load(std::memory_order_acquire);
    if (present == nullptr) {
      if (made == nullptr) {
        // If several threads test the bound at the same time, they may exceed it by at most their
        // number.
        if (count_.load(std::memory_order_relaxed) >= kMostNames) return nullptr;
        made = std::make_unique<EventName>(name, matches(name));
      }
      if (slots_[index].compare_exchange_strong(present, made.get(), std::memory_order_acq_rel)) {
        count_.fetch_add(1, std::memory_order_relaxed);
        return made.release();
      }
      // Another thread has set the slot first. Its entry is now in `present`, and may be the entry
      // of this name.
    }
    // Try the next slot, until the slot has the name or is empty. An empty slot proves that the
    // name is not in the table, because entries are never removed.
    if (present->text == name) return present;
    index = (index + 1) % kSlots;
  }
}

bool EventNames::matches(std::string_view name) const {
  const std::string text(name);
  return std::ranges::any_of(wantedPatterns_, [&](const std::string& pattern) {
    return ::fnmatch(pattern.c_str(), text.c_str(), 0) == 0;
  });
}

}  // namespace halvox::platform::linux_
