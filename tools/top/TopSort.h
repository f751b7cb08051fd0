#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include "tools/top/TopSnapshot.h"

namespace halvox::tools {

enum class TopSortKey : std::uint8_t { kXruns, kApplication, kDevice, kVolume, kStarted };

struct TopSort {
  TopSortKey key = TopSortKey::kXruns;
  bool isReversed = false;
};

// "xruns", "app", "device", "volume", "started".
[[nodiscard]] std::string_view sortName(TopSortKey key);
[[nodiscard]] std::optional<TopSortKey> sortKeyOf(std::string_view name);
// Returns the key that comes after `key`, and the first one after the last.
[[nodiscard]] TopSortKey nextSortKey(TopSortKey key);

// Sorts streams by the key, the most urgent first, and devices by their xruns. Equal streams are in
// the order of their starts, so that they do not change places from turn to turn.
void sortSnapshot(TopSnapshot& snapshot, const TopSort& sort);

}  // namespace halvox::tools
