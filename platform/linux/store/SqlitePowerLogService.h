#pragma once

#include "platform/clock.h"
#include "platform/linux/store/SqliteStore.h"
#include "platform/power_log.h"

namespace halvox::platform::linux_ {

// Records power events in the store with the time of the call. Any thread may call. Does not own
// the store and the clock, which must outlive it. Failures of the store are counted and logged
// there and never reach the caller.
class SqlitePowerLogService final : public PowerLogService {
 public:
  SqlitePowerLogService(SqliteStore& store, const ClockService& clock)
      : records_(store.powerEvents()), clock_(clock) {}

  // Stores `payload` and `extra` as one dictionary. If a key is in both, the value in `extra` is
  // lost.
  void logPowerEvent(std::uint32_t categoryID, std::string_view eventName,
                     const Dictionary& payload, const std::optional<Dictionary>& extra) override;

 private:
  PowerEventRecords& records_;
  const ClockService& clock_;
};

}  // namespace halvox::platform::linux_
