#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

namespace halvox::platform {

// What a counter counts: what was received, done or delivered, or what was not.
enum class CounterKind : std::uint8_t { kProgress, kLoss };

// The kind of the counter with that name, whatever piece it belongs to. None if the name is not in
// the table of counter_kinds.cpp. Everyone who makes a counter adds its name there; tests find
// counters that are missing. Readers that get only names, such as the tools, need this table.
[[nodiscard]] std::optional<CounterKind> counterKind(std::string_view name);

// Whether a counter of that name counts what was not delivered. False for an unknown name.
[[nodiscard]] inline bool isLoss(std::string_view counterName) {
  return counterKind(counterName) == CounterKind::kLoss;
}

}  // namespace halvox::platform
