#pragma once

#include "platform/analytics.h"
#include "platform/clock.h"
#include "platform/linux/store/SqliteStore.h"

namespace halvox::platform::linux_ {

// Records analytics events in the store. Only events whose names match StoreOptions::wantedEvents
// are used.
// Any thread may call. Does not own the store and the clock, which must outlive it. Failures of the
// store are counted and logged there and never reach the caller.
class SqliteAnalyticsService final : public AnalyticsService {
 public:
  SqliteAnalyticsService(SqliteStore& store, const ClockService& clock)
      : names_(store.eventNames()), records_(store.messages()), clock_(clock) {}

  [[nodiscard]] bool isAnalyticsEventUsed(std::string_view eventName) override;
  // Records the event with the time of the call. The builder runs later, on the writer's thread.
  void sendAnalyticsEventLazy(std::string_view eventName, AnalyticsPayloadBuilder builder) override;

 private:
  EventNames& names_;
  MessageRecords& records_;
  const ClockService& clock_;
};

}  // namespace halvox::platform::linux_
