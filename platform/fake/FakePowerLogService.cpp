#include "platform/fake/FakePowerLogService.h"

#include <ostream>

namespace halvox::platform {

Dictionary FakePowerLogService::Event::recorded() const {
  Dictionary all = extra.value_or(Dictionary());
  all.merge(payload);
  return all;
}

std::vector<FakePowerLogService::Event> FakePowerLogService::events() const {
  const std::lock_guard lock(mutex_);
  return events_;
}

void FakePowerLogService::logPowerEvent(std::uint32_t categoryID, std::string_view eventName,
                                        const Dictionary& payload,
                                        const std::optional<Dictionary>& extra) {
  journal_.record(JournalKind::kPowerEvent, eventName);
  const std::lock_guard lock(mutex_);
  events_.push_back({categoryID, std::string(eventName), payload, extra});
}

void PrintTo(const FakePowerLogService::Event& event, std::ostream* stream) {
  *stream << event.categoryID << ' ' << event.name << ' ' << describe(event.payload);
}

}  // namespace halvox::platform
