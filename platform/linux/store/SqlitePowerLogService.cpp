#include "platform/linux/store/SqlitePowerLogService.h"

#include <string>
#include <utility>

namespace halvox::platform::linux_ {

void SqlitePowerLogService::logPowerEvent(std::uint32_t categoryID, std::string_view eventName,
                                          const Dictionary& payload,
                                          const std::optional<Dictionary>& extra) {
  Dictionary all = extra.value_or(Dictionary());
  if (all.size() == 0) {
    all = payload;
  } else {
    all.merge(payload);
  }
  records_.add({.time = clock_.currentDate().secondsSince1970,
                .categoryID = categoryID,
                .eventName = std::string(eventName),
                .payload = std::move(all)});
}

}  // namespace halvox::platform::linux_
