#include "analysis/BucketCounts.h"

#include <limits>

#include <gtest/gtest.h>

namespace halvox::analysis {
namespace {

constexpr double kNoBound = std::numeric_limits<double>::infinity();

TEST(BucketCountsTest, HistogramsAreMergedByTheirBounds) {
  BucketCounts counts;

  counts.add(0, 50, 3);
  counts.add(50, 100, 1);
  counts.add(0, 50, 4);

  const auto buckets = counts.buckets();
  ASSERT_EQ(buckets.size(), 2U);
  EXPECT_EQ(buckets[0].hits, 7U);
  EXPECT_EQ(buckets[1].hits, 1U);
  EXPECT_EQ(counts.count(), 8U);
}

TEST(BucketCountsTest, APercentileIsTheUpperBoundOfItsBucket) {
  BucketCounts counts;
  counts.add(0, 50, 90);
  counts.add(50, 100, 9);
  counts.add(100, 200, 1);

  EXPECT_EQ(counts.percentile(0.5), 50);
  EXPECT_EQ(counts.percentile(0.9), 50);
  EXPECT_EQ(counts.percentile(0.95), 100);
  EXPECT_EQ(counts.percentile(0.99), 100);
  EXPECT_EQ(counts.percentile(1), 200);
}

TEST(BucketCountsTest, WithoutAnUpperBoundAPercentileIsTheLowerOne) {
  BucketCounts counts;
  counts.add(50'000, kNoBound, 1);

  EXPECT_EQ(counts.percentile(0.5), 50'000);
}

TEST(BucketCountsTest, NothingCountedHasNoPercentile) {
  EXPECT_EQ(BucketCounts().percentile(0.5), 0);
}

TEST(BucketCountsTest, ValuesAreCountedBetweenPowersOfTwo) {
  BucketCounts counts;

  for (const double value : {0.0, -3.0, 1.0, std::numeric_limits<double>::quiet_NaN()}) {
    counts.addValue(value);
  }
  counts.addValue(8);
  counts.addValue(8.5);

  const auto buckets = counts.buckets();
  ASSERT_EQ(buckets.size(), 3U);
  EXPECT_EQ(buckets[0].hits, 4U);
  EXPECT_EQ(buckets[1].lower, 4);
  EXPECT_EQ(buckets[1].upper, 8);
  EXPECT_EQ(buckets[2].lower, 8);
  EXPECT_EQ(buckets[2].upper, 16);
}

TEST(BucketCountsTest, HitsOfAnyNumberDoNotOverflow) {
  constexpr auto kMany = static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max());
  BucketCounts counts;

  counts.add(0, 10, 5);
  for (int time = 0; time < 3; ++time) counts.add(10, 20, kMany);

  EXPECT_EQ(counts.count(), BucketCounts::kMostHits);
  EXPECT_EQ(counts.percentile(0.5), 20);
}

TEST(BucketCountsTest, TooManyBoundsAreCountedAndNotKept) {
  BucketCounts counts;

  for (std::size_t bound = 0; bound < BucketCounts::kMostBuckets + 5; ++bound) {
    counts.add(static_cast<double>(bound), static_cast<double>(bound + 1), 2);
  }

  EXPECT_EQ(counts.buckets().size(), BucketCounts::kMostBuckets);
  EXPECT_EQ(counts.notKept(), 10U);
}

}  // namespace
}  // namespace halvox::analysis
