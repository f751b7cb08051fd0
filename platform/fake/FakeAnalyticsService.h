#pragma once

#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "platform/analytics.h"
#include "platform/fake/Journal.h"

namespace halvox::platform {

// An analytics service that keeps what it was sent. At first every name is wanted. A payload is
// never built by the sender, but later: when the test reads the events or, if it says so,
// only when told. Any thread may call; the test reads from its own.
class FakeAnalyticsService final : public AnalyticsService {
 public:
  // kWhenSent: on another thread, as by a store whose writer is faster than the sender.
  enum class Building : unsigned char { kWhenRead, kWhenTold, kWhenSent };
  struct Event {
    std::string name;
    std::optional<Dictionary> payload;  // none until it was built
  };

  // Does not own the journal, which must outlive it.
  explicit FakeAnalyticsService(Journal& journal) : journal_(journal) {}

  void wantEverything();
  // From now on only these names are wanted; none at all with an empty set.
  void wantOnly(std::set<std::string, std::less<>> names);
  void setBuilding(Building building);
  // Builds the payloads that are not built yet, in the order of their sending, on this thread; lets
  // go of their builders.
  void buildPayloads() const;
  // Forgets what was asked, sent and not built yet.
  void clear();

  [[nodiscard]] std::vector<Event> events() const;
  [[nodiscard]] std::vector<Event> events(std::string_view name) const;
  [[nodiscard]] std::vector<std::string> sentNames() const;
  // The names that were asked for, in order.
  [[nodiscard]] std::vector<std::string> testedNames() const;

  [[nodiscard]] bool isAnalyticsEventUsed(std::string_view eventName) override;
  void sendAnalyticsEventLazy(std::string eventName, AnalyticsPayloadBuilder builder) override;

 private:
  struct Record {
    Event event;
    AnalyticsPayloadBuilder builder;  // empty once the payload is built
  };

  [[nodiscard]] bool buildsWhenRead() const;

  Journal& journal_;
  mutable std::mutex mutex_;
  std::optional<std::set<std::string, std::less<>>> wanted_;  // none: everything
  Building building_ = Building::kWhenRead;
  mutable std::vector<Record> records_;  // reading builds
  std::vector<std::string> tested_;
};

}  // namespace halvox::platform
