#pragma once

#include "platform/analytics.h"
#include "platform/clock.h"
#include "platform/linux/store/SqliteStore.h"

namespace halvox::platform::linux_ {

// Records events in the store. Wanted are the names that match the store's patterns.
// Any thread may call. Does not own the store and the clock, which must outlive it.
class SqliteAnalyticsService final : public AnalyticsService {
 public:
  SqliteAnalyticsService(SqliteStore& store, const ClockService& clock)
      : names_(store.eventNames()), records_(store.analyticsRecords()), clock_(clock) {}

  [[nodiscard]] bool isAnalyticsEventUsed(std::string_view eventName) override;
  // The event's time is that of the call.
  void sendAnalyticsEventLazy(std::string eventName, AnalyticsPayloadBuilder builder) override;

 private:
  EventNames& names_;
  AnalyticsRecords& records_;
  const ClockService& clock_;
};

}  // namespace halvox::platform::linux_
