#include "analysis/NameCounts.h"

#include <algorithm>
#include <cmath>
#include <cstddef>

namespace halvox::analysis {
namespace {

// Of a number that may be negative.
std::int64_t halfDown(std::int64_t number) { return (number - (number & 1)) / 2; }

// A time that a clock can have had. Records of a broken clock must not overflow the numbers of
// steps.
double sane(double time) {
  constexpr double kYear3000 = 32'503'680'000;
  return std::isfinite(time) ? std::clamp(time, -kYear3000, kYear3000) : 0;
}

}  // namespace

void NameCounts::add(std::string_view name, double time) {
  const double at = sane(time);
  const std::size_t step = stepOf(at);
  Series* const series = find(name, at);
  if (series == nullptr) {
    ++otherNames_;
    return;
  }
  ++series->count;
  series->first = std::min(series->first, at);
  series->last = std::max(series->last, at);
  ++series->steps[step];
}

NameCounts::Series* NameCounts::find(std::string_view name, double time) {
  auto found = names_.find(name);
  if (found == names_.end()) {
    if (names_.size() >= kMostNames) return nullptr;
    found = names_.emplace(std::string(name), Series{}).first;
    found->second.name = name;
    found->second.first = found->second.last = time;
  }
  return &found->second;
}

// Returns the index of the step of that time, after making it fit.
std::size_t NameCounts::stepOf(double time) {
  const auto numberOf = [&] { return static_cast<std::int64_t>(std::floor(time / step_)); };
  if (isEmpty_) {
    isEmpty_ = false;
    origin_ = numberOf();
    end_ = origin_ + 1;
  }
  while (std::max(numberOf() + 1, end_) - std::min(numberOf(), origin_) >
         static_cast<std::int64_t>(kSteps)) {
    joinSteps();
  }
  const std::int64_t number = numberOf();
  if (number < origin_) moveOrigin(number);
  end_ = std::max(end_, number + 1);
  return static_cast<std::size_t>(number - origin_);
}

void NameCounts::joinSteps() {
  const std::int64_t origin = halfDown(origin_);
  for (auto& [name, series] : names_) {
    std::array<std::uint32_t, kSteps> joined{};
    for (std::size_t index = 0; index < kSteps; ++index) {
      if (series.steps[index] == 0) continue;
      const std::int64_t number = halfDown(origin_ + static_cast<std::int64_t>(index));
      joined[static_cast<std::size_t>(number - origin)] += series.steps[index];
    }
    series.steps = joined;
  }
  end_ = halfDown(end_ - 1) + 1;
  origin_ = origin;
  step_ *= 2;
}

void NameCounts::moveOrigin(std::int64_t origin) {
  const auto shift = static_cast<std::size_t>(origin_ - origin);
  for (auto& [name, series] : names_) {
    std::rotate(series.steps.begin(), series.steps.end() - static_cast<std::ptrdiff_t>(shift),
                series.steps.end());
  }
  origin_ = origin;
}

std::vector<const NameCounts::Series*> NameCounts::series() const {
  std::vector<const Series*> list;
  for (const auto& [name, series] : names_) list.push_back(&series);
  std::ranges::sort(list, [](const Series* one, const Series* other) {
    return one->count != other->count ? one->count > other->count : one->name < other->name;
  });
  return list;
}

}  // namespace halvox::analysis
