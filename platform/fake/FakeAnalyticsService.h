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

// Keeps the events that were sent to it. At first it wants every name.
//
// The fake never builds a payload in the sender's call, because that would hide a builder with a
// dangling reference. Like the store, it builds the payload later: by default when the test reads
// the events.
//
// Any thread may call the service; only the test's thread reads the results. FakePlatform owns it.
class FakeAnalyticsService final : public AnalyticsService {
 public:
  // When payloads are built: when the test reads the events; when the test calls buildPayloads();
  // or at once, on another thread, like a store whose writer is faster than the sender.
  enum class Building : unsigned char { kWhenRead, kWhenTold, kWhenSent };
  struct Event {
    std::string name;
    std::optional<Dictionary> payload;  // none until it has been built
  };

  // Does not own the journal, which must outlive it.
  explicit FakeAnalyticsService(Journal& journal) : journal_(journal) {}

  void wantEverything();
  // Sets the names that are wanted from then on; with an empty set, none is.
  void wantOnly(std::set<std::string, std::less<>> names);
  void setBuilding(Building building);
  // Builds the payloads that have not been built, in the order of sending, on this thread. Releases
  // their builders.
  void buildPayloads() const;
  // Forgets the tested names and all events, including those whose payloads have not been built.
  void clear();

  [[nodiscard]] std::vector<Event> events() const;
  [[nodiscard]] std::vector<Event> events(std::string_view name) const;
  [[nodiscard]] std::vector<std::string> sentNames() const;
  // The names that isAnalyticsEventUsed() was called with, in order.
  [[nodiscard]] std::vector<std::string> testedNames() const;

  [[nodiscard]] bool isAnalyticsEventUsed(std::string_view eventName) override;
  void sendAnalyticsEventLazy(std::string_view eventName, AnalyticsPayloadBuilder builder) override;

 private:
  struct Record {
    Event event;
    AnalyticsPayloadBuilder builder;  // empty when the payload has been built
  };

  [[nodiscard]] bool buildsWhenRead() const;

  Journal& journal_;
  mutable std::mutex mutex_;
  std::optional<std::set<std::string, std::less<>>> wanted_;  // none: everything
  Building building_ = Building::kWhenRead;
  mutable std::vector<Record> records_;  // mutable: reading them builds payloads
  std::vector<std::string> tested_;
};

}  // namespace halvox::platform
