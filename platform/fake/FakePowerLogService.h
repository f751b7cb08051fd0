#pragma once

#include <cstdint>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/fake/Journal.h"
#include "platform/power_log.h"

namespace halvox::platform {

// A power log that keeps its events. Any thread may call; the test reads from its own.
class FakePowerLogService final : public PowerLogService {
 public:
  struct Event {
    std::uint32_t categoryID;
    std::string name;
    Dictionary payload;
    std::optional<Dictionary> extra;
    // The payload with the entries that `extra` adds to it, as it is recorded.
    [[nodiscard]] Dictionary recorded() const;
    friend bool operator==(const Event&, const Event&) = default;
  };

  // Does not own the journal, which must outlive it.
  explicit FakePowerLogService(Journal& journal) : journal_(journal) {}

  [[nodiscard]] std::vector<Event> events() const;

  void logPowerEvent(std::uint32_t categoryID, std::string_view eventName,
                     const Dictionary& payload, const std::optional<Dictionary>& extra) override;

 private:
  Journal& journal_;
  mutable std::mutex mutex_;
  std::vector<Event> events_;
};

// For the messages of failed tests.
void PrintTo(const FakePowerLogService::Event& event, std::ostream* stream);

}  // namespace halvox::platform
