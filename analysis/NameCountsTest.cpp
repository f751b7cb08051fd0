#include "analysis/NameCounts.h"

#include <limits>
#include <numeric>

#include <gtest/gtest.h>

namespace halvox::analysis {
namespace {

std::uint64_t sumOf(const NameCounts::Series& series) {
  return std::accumulate(series.steps.begin(), series.steps.end(), std::uint64_t{0});
}

// How many were counted in the step of that time.
std::uint32_t countAt(const NameCounts& counts, const NameCounts::Series& series, double time) {
  return series.steps[static_cast<std::size_t>((time - counts.from()) / counts.step())];
}

TEST(NameCountsTest, NamesComeInTheOrderOfTheirCounts) {
  NameCounts counts;

  counts.add("rare", 100);
  counts.add("frequent", 101);
  counts.add("frequent", 99);

  const auto series = counts.series();
  ASSERT_EQ(series.size(), 2U);
  EXPECT_EQ(series[0]->name, "frequent");
  EXPECT_EQ(series[0]->count, 2U);
  EXPECT_EQ(series[0]->first, 99);
  EXPECT_EQ(series[0]->last, 101);
}

TEST(NameCountsTest, StepsAreJoinedUntilTheWholeTimeFits) {
  NameCounts counts;
  constexpr int kDays = 30;

  for (int day = 0; day < kDays; ++day) counts.add("daily", 1'000'000 + 86'400.0 * day);

  const auto& series = *counts.series().front();
  EXPECT_EQ(sumOf(series), 30U);
  for (int day = 0; day < kDays; ++day) {
    EXPECT_EQ(countAt(counts, series, 1'000'000 + 86'400.0 * day), 1U) << day;
  }
  EXPECT_LE(kDays * 86'400.0 / counts.step(), NameCounts::kSteps);
  EXPECT_GE(kDays * 86'400.0 / counts.step(), NameCounts::kSteps / 4.0);
}

TEST(NameCountsTest, EarlierTimesThanTheFirstAreCounted) {
  NameCounts counts;

  for (const double time : {1000.0, 990.0, -5000.0, 1000.0}) counts.add("name", time);

  const auto& series = *counts.series().front();
  EXPECT_EQ(sumOf(series), 4U);
  EXPECT_EQ(countAt(counts, series, -5000), 1U);
  EXPECT_EQ(countAt(counts, series, 990), 1U);
  EXPECT_EQ(countAt(counts, series, 1000), 2U);
}

TEST(NameCountsTest, ImpossibleTimesAreCounted) {
  NameCounts counts;

  for (const double time : {1e300, -1e300, std::numeric_limits<double>::quiet_NaN()}) {
    counts.add("name", time);
  }

  EXPECT_EQ(sumOf(*counts.series().front()), 3U);
}

TEST(NameCountsTest, TooManyNamesAreCountedTogether) {
  NameCounts counts;

  for (std::size_t name = 0; name < NameCounts::kMostNames + 3; ++name) {
    counts.add(std::to_string(name), 1);
    counts.add("0", 1);
  }

  EXPECT_EQ(counts.series().size(), NameCounts::kMostNames);
  EXPECT_EQ(counts.otherNames(), 3U);
  EXPECT_EQ(counts.series().front()->name, "0");
}

}  // namespace
}  // namespace halvox::analysis
