#include "tools/top/TopSort.h"

#include <algorithm>
#include <array>
#include <tuple>
#include <utility>

namespace halvox::tools {
namespace {

constexpr std::array<std::pair<TopSortKey, std::string_view>, 5> kNames{
    {{TopSortKey::kXruns, "xruns"},
     {TopSortKey::kApplication, "app"},
     {TopSortKey::kDevice, "device"},
     {TopSortKey::kVolume, "volume"},
     {TopSortKey::kStarted, "started"}}};

bool isRunning(const TopStream& stream) { return stream.state == TopStreamState::kRunning; }

// Whether `left` comes before `right`. False for both if they are equal by the key.
bool isBefore(TopSortKey key, const TopStream& left, const TopStream& right) {
  switch (key) {
    case TopSortKey::kXruns:
      return std::tuple(left.xruns, left.lostMilliseconds, isRunning(left)) >
             std::tuple(right.xruns, right.lostMilliseconds, isRunning(right));
    case TopSortKey::kApplication:
      return left.application < right.application;
    case TopSortKey::kDevice:
      return left.device < right.device;
    case TopSortKey::kVolume:
      return left.volume.value_or(-1) > right.volume.value_or(-1);
    case TopSortKey::kStarted:
      return left.started > right.started;
  }
  return false;
}

}  // namespace

std::string_view sortName(TopSortKey key) {
  return std::ranges::find(kNames, key, &std::pair<TopSortKey, std::string_view>::first)->second;
}

std::optional<TopSortKey> sortKeyOf(std::string_view name) {
  for (const auto& [key, text] : kNames) {
    if (text == name) return key;
  }
  return std::nullopt;
}

TopSortKey nextSortKey(TopSortKey key) {
  for (std::size_t index = 0; index < kNames.size(); ++index) {
    if (kNames[index].first == key) return kNames[(index + 1) % kNames.size()].first;
  }
  return TopSortKey::kXruns;
}

void sortSnapshot(TopSnapshot& snapshot, const TopSort& sort) {
  std::ranges::sort(snapshot.streams, {},
                    [](const TopStream& stream) { return std::pair(stream.started, stream.id); });
  std::ranges::stable_sort(snapshot.streams, [&](const TopStream& left, const TopStream& right) {
    return sort.isReversed ? isBefore(sort.key, right, left) : isBefore(sort.key, left, right);
  });
  std::ranges::stable_sort(snapshot.devices, [](const TopDevice& left, const TopDevice& right) {
    return std::tuple(left.xruns, left.streams, left.busy.value_or(0)) >
           std::tuple(right.xruns, right.streams, right.busy.value_or(0));
  });
}

}  // namespace halvox::tools
