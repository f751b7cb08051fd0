#include <cmath>
#include <cstdint>
#include <limits>
#include <random>
#include <string>

#include <gtest/gtest.h>

#include "backends/HVReportingUtility.h"

namespace halvox {
namespace {

using platform::Array;
using platform::Value;

// Returns the bucket of `number`, or "none".
std::string bucket(const Value& number, const Array& buckets, const Value& digits) {
  return HVReportingUtilityBucketNumberToString(number, buckets, digits).value_or("none");
}

// A single bucket is always chosen: this returns how it is formatted.
std::string written(const Value& only, const Value& digits) { return bucket(0, {only}, digits); }

// --- Rounding -----------------------------------------------------------------------------------

TEST(HVReportingUtilityRoundWithPlacesTest, HalvesRoundAwayFromZero) {
  EXPECT_EQ(HVReportingUtilityRoundWithPlaces(2.5, 0), 3.0);
  EXPECT_EQ(HVReportingUtilityRoundWithPlaces(-2.5, 0), -3.0);
  EXPECT_EQ(HVReportingUtilityRoundWithPlaces(-0.125, 2), -0.13);
}

TEST(HVReportingUtilityRoundWithPlacesTest, FollowsDoubleArithmetic) {
  EXPECT_EQ(HVReportingUtilityRoundWithPlaces(1.005, 2), 1.0);
}

TEST(HVReportingUtilityRoundWithPlacesTest, NegativePlacesRoundToTensAndHundreds) {
  EXPECT_EQ(HVReportingUtilityRoundWithPlaces(1234.0, -1), 1230.0);
  EXPECT_EQ(HVReportingUtilityRoundWithPlaces(1250.0, -2), 1300.0);
}

TEST(HVReportingUtilityRoundWithPlacesTest, RoundedNumbersStayAsTheyAre) {
  std::mt19937_64 random(7);  // the same values in every run
  std::uniform_real_distribution<double> numbers(-1e6, 1e6);
  for (int round = 0; round < 10'000; ++round) {
    const double once = HVReportingUtilityRoundWithPlaces(numbers(random), 3);
    ASSERT_EQ(HVReportingUtilityRoundWithPlaces(once, 3), once);
  }
}

TEST(HVReportingUtilityRoundWithPlacesTest, NaNStaysNaN) {
  EXPECT_TRUE(std::isnan(HVReportingUtilityRoundWithPlaces(std::nan(""), 2)));
}

// --- Choice of the bucket -----------------------------------------------------------------------

TEST(HVReportingUtilityBucketTest, TheNearestBucketIsChosen) {
  EXPECT_EQ(bucket(4, {0, 10, 20}, 0), "0");
  EXPECT_EQ(bucket(6, {0, 10, 20}, 0), "10");
  EXPECT_EQ(bucket(1000, {0, 10, 20}, 0), "20");
  EXPECT_EQ(bucket(-1000, {0, 10, 20}, 0), "0");
}

TEST(HVReportingUtilityBucketTest, OfTwoEquallyNearTheLaterWins) {
  EXPECT_EQ(bucket(5, {0, 10, 20}, 0), "10");
  EXPECT_EQ(bucket(15, {0, 10, 20}, 0), "20");
  EXPECT_EQ(bucket(15, {20, 10, 0}, 0), "10");
}

TEST(HVReportingUtilityBucketTest, DescendingBucketsWork) {
  EXPECT_EQ(bucket(4, {20, 10, 0}, 0), "0");
  EXPECT_EQ(bucket(14, {20, 10, 0}, 0), "10");
}

TEST(HVReportingUtilityBucketTest, TheWalkStopsAtTheFirstBucketThatIsFarther) {
  EXPECT_EQ(bucket(6, {0, 100, 5}, 0), "0");
}

TEST(HVReportingUtilityBucketTest, ASingleBucketIsAlwaysChosen) {
  EXPECT_EQ(bucket(-1e300, {7}, 0), "7");
  EXPECT_EQ(bucket(7, {7}, 0), "7");
  EXPECT_EQ(bucket(std::numeric_limits<double>::infinity(), {7}, 0), "7");
}

TEST(HVReportingUtilityBucketTest, WithoutBucketsThereIsNone) {
  EXPECT_EQ(HVReportingUtilityBucketNumberToString(1, {}, 2), std::nullopt);
}

TEST(HVReportingUtilityBucketTest, DistancesAreComputedWithDoubles) {
  EXPECT_EQ(bucket(true, {0, 1.0F, std::uint8_t{2}}, 0), "1");
  EXPECT_EQ(bucket(0.9, {0.5, 1, 2}, 1), "1.0");
}

TEST(HVReportingUtilityBucketTest, NaNTakesTheLastBucket) {
  // Comparing its distance with another is always false.
  EXPECT_EQ(bucket(std::nan(""), {0, 10, 20}, 0), "20");
}

TEST(HVReportingUtilityBucketTest, TheChoiceIsNearestInSortedBuckets) {
  const Array buckets{0, 1, 2, 5, 10, 20, 50, 100};
  std::mt19937 random(7);  // the same values in every run
  std::uniform_real_distribution<double> numbers(-10, 150);
  for (int round = 0; round < 10'000; ++round) {
    const double number = numbers(random);
    const double chosen = std::stod(bucket(number, buckets, 0));
    for (const Value& other : buckets) {
      ASSERT_LE(std::fabs(number - chosen), std::fabs(number - other.toDouble())) << number;
    }
  }
}

// --- Text of the bucket -------------------------------------------------------------------------

TEST(HVReportingUtilityBucketTest, WithoutFractionDigitsThereIsNoPoint) {
  EXPECT_EQ(bucket(0.9, {0.5, 1, 2}, 0), "1");
  EXPECT_EQ(written(3.0, 0), "3");
  EXPECT_EQ(written(-3, 0), "-3");
}

TEST(HVReportingUtilityBucketTest, WithFractionDigitsThereIsOneAtLeast) {
  EXPECT_EQ(written(1, 1), "1.0");
  EXPECT_EQ(written(1.0, 3), "1.0");
  EXPECT_EQ(written(0, 3), "0.0");
  EXPECT_EQ(written(0.25, 3), "0.25");
  EXPECT_EQ(written(1.999, 2), "2.0");
  EXPECT_EQ(written(0.30001, 3), "0.3");
}

TEST(HVReportingUtilityBucketTest, ExactHalvesAreRoundedToEven) {
  EXPECT_EQ(written(0.5, 0), "0");
  EXPECT_EQ(written(1.5, 0), "2");
  EXPECT_EQ(written(2.5, 0), "2");
  EXPECT_EQ(written(-2.5, 0), "-2");
  EXPECT_EQ(written(-3.5, 0), "-4");
  EXPECT_EQ(written(0.25, 1), "0.2");
  EXPECT_EQ(written(0.75, 1), "0.8");
  EXPECT_EQ(written(0.125, 2), "0.12");
}

TEST(HVReportingUtilityBucketTest, HalvesAreThoseOfTheDecimalDigits) {
  EXPECT_EQ(written(0.35, 1), "0.4");   // a little less than a half in binary
  EXPECT_EQ(written(0.45, 1), "0.4");   // a little more
  EXPECT_EQ(written(0.35F, 1), "0.4");  // its own digits, not those of the double next to it
}

TEST(HVReportingUtilityBucketTest, OtherFractionsAreRoundedToTheNearest) {
  EXPECT_EQ(written(0.26, 1), "0.3");
  EXPECT_EQ(written(0.24, 1), "0.2");
  EXPECT_EQ(written(2.51, 0), "3");
  EXPECT_EQ(written(2.5000001, 0), "3");
  EXPECT_EQ(written(2.49, 0), "2");
}

TEST(HVReportingUtilityBucketTest, RoundingUpCarriesToTheLeft) {
  EXPECT_EQ(written(9.96, 1), "10.0");
  EXPECT_EQ(written(99.5, 0), "100");
  EXPECT_EQ(written(-99.9, 0), "-100");
  EXPECT_EQ(written(0.996, 2), "1.0");
}

TEST(HVReportingUtilityBucketTest, LargeNumbersHaveNoGroupsAndNoExponent) {
  EXPECT_EQ(written(1234567, 0), "1234567");
  EXPECT_EQ(written(1e15, 0), "1000000000000000");
  EXPECT_EQ(written(1e21, 1), "1000000000000000000000.0");
  EXPECT_EQ(written(std::numeric_limits<std::uint64_t>::max(), 0), "18446744073709551615");
  EXPECT_EQ(written(std::numeric_limits<std::int64_t>::min(), 0), "-9223372036854775808");
}

TEST(HVReportingUtilityBucketTest, TheLongestAndTheSmallestNumbersAreWritten) {
  EXPECT_EQ(written(std::numeric_limits<double>::max(), 0).size(), 309U);
  EXPECT_EQ(written(-std::numeric_limits<double>::denorm_min(), 400).size(), 327U);
  EXPECT_EQ(written(std::numeric_limits<double>::denorm_min(), 3), "0.0");
}

TEST(HVReportingUtilityBucketTest, ManyFractionDigitsAddNothing) {
  EXPECT_EQ(written(0.1, 1000), "0.1");
  EXPECT_EQ(written(0.1, std::numeric_limits<std::uint64_t>::max()), "0.1");
}

TEST(HVReportingUtilityBucketTest, FractionDigitsAreReadAsAnUnsignedInteger) {
  EXPECT_EQ(written(0.123, 1.9), "0.1");
  EXPECT_EQ(written(0.123, std::uint8_t{2}), "0.12");
}

TEST(HVReportingUtilityBucketTest, NaNAndInfinityAreWrittenAsSuch) {
  EXPECT_EQ(written(std::nan(""), 2), "nan");
  EXPECT_EQ(written(std::numeric_limits<double>::infinity(), 2), "inf");
}

}  // namespace
}  // namespace halvox
